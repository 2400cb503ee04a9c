#include "report/scalar_rounding.h"

#include <cmath>
#include <limits>

#include "report/saturate.h"

namespace tally {
namespace {

// Halves go up for sums that are not negative; negative sums are rounded toward zero.
std::int64_t toMultiple(std::int64_t value, std::uint32_t interval) {
  if (interval == 0) return value;
  std::int64_t sum = 0;
  if (__builtin_add_overflow(value, std::int64_t{interval / 2}, &sum)) {
    sum = std::numeric_limits<std::int64_t>::max();
  }
  return sum - sum % std::int64_t{interval};
}

std::int64_t toSignificantFigures(std::int64_t value, std::uint32_t figures) {
  if (value == 0) return 0;
  const double digits = std::ceil(std::log10(std::fabs(static_cast<double>(value))));
  const std::int64_t shift = static_cast<std::int64_t>(digits) - std::int64_t{figures};
  if (shift < 1) return value;
  // At most 19: these are the powers of ten that a signed 64-bit integer can reach, all exact.
  static constexpr double kPowers[] = {1e0,  1e1,  1e2,  1e3,  1e4,  1e5,  1e6,  1e7,  1e8,  1e9,
                                       1e10, 1e11, 1e12, 1e13, 1e14, 1e15, 1e16, 1e17, 1e18, 1e19};
  const double power = kPowers[shift];
  return saturatedInt64(power * std::round(static_cast<double>(value) / power));
}

}  // namespace

std::int64_t roundScalar(std::int64_t value, const ScalarOptions& options,
                         std::vector<RoundingStep>* steps) {
  static constexpr struct {
    std::string_view option;
    std::int64_t (*apply)(std::int64_t, std::uint32_t);
  } kSteps[] = {{kOptionBucketInterval, toMultiple},
                {kOptionSignificantFigures, toSignificantFigures}};
  if (options.empty()) return value;
  for (const auto& step : kSteps) {
    const auto setting = unsignedOption(options, step.option);
    if (!setting) continue;
    const std::int64_t before = value;
    value = step.apply(before, *setting);
    if (steps != nullptr) steps->push_back({step.option, *setting, before, value});
  }
  return value;
}

}  // namespace tally
