#include "config/whitelist_options.h"

#include <algorithm>
#include <cmath>
#include <limits>

#include "config/saturate.h"

namespace tally {
namespace {

// Halves are rounded up for sums that are not negative; negative sums are rounded toward zero. An
// interval of 0 rounds nothing.
std::int64_t roundToMultiple(std::int64_t value, std::uint32_t interval) {
  if (interval == 0) return value;
  std::int64_t sum = 0;
  if (__builtin_add_overflow(value, std::int64_t{interval / 2}, &sum)) {
    sum = std::numeric_limits<std::int64_t>::max();
  }
  return sum - sum % std::int64_t{interval};
}

RoundingGrid gridOfMultiples(std::int64_t, std::uint32_t interval) {
  return {std::max(interval, 1U), std::numeric_limits<std::int64_t>::max()};
}

std::optional<SettingRemark> remarkOnInterval(std::uint32_t interval) {
  if (interval == 0) {
    return SettingRemark{true, true, "a step of 0 rounds nothing; values are reported unchanged"};
  }
  if (interval == 1) return SettingRemark{false, true, "a step of 1 rounds nothing"};
  return std::nullopt;
}

// Digits before the point; one less for powers of ten. REQUIRES: value is not 0.
int digitsOf(std::int64_t value) {
  return static_cast<int>(std::ceil(std::log10(std::fabs(static_cast<double>(value)))));
}

// The step changes with the number of digits: 50 becomes 100 without a figure, and 10 stays 10.
int pieceOfFigures(std::int64_t value) {
  if (value == 0) return 0;
  return value > 0 ? 1 + digitsOf(value) : -1 - digitsOf(value);
}

std::int64_t roundToFigures(std::int64_t value, std::uint32_t figures) {
  if (value == 0) return 0;
  const std::int64_t shift = digitsOf(value) - std::int64_t{figures};
  if (shift < 1) return value;
  // At most 19: these are the powers of ten that a signed 64-bit integer can reach, all exact.
  static constexpr double kPowers[] = {1e0,  1e1,  1e2,  1e3,  1e4,  1e5,  1e6,  1e7,  1e8,  1e9,
                                       1e10, 1e11, 1e12, 1e13, 1e14, 1e15, 1e16, 1e17, 1e18, 1e19};
  const double power = kPowers[shift];
  return saturatedInt64(power * std::round(static_cast<double>(value) / power));
}

// Each power of ten ends a grid, and begins the next beyond it.
RoundingGrid gridOfFigures(std::int64_t value, std::uint32_t figures) {
  constexpr std::uint64_t kEnd = std::numeric_limits<std::int64_t>::max();
  constexpr std::uint32_t kMostDigits = 19;
  if (figures >= kMostDigits) return {1, std::numeric_limits<std::int64_t>::max()};
  const std::uint64_t size =
      value < 0 ? 0 - static_cast<std::uint64_t>(value) : static_cast<std::uint64_t>(value);
  std::uint64_t step = 1, former = 0, power = 1;
  for (std::uint32_t i = 0; i < figures; ++i) power *= 10;
  while (power < size) {
    former = power;
    power *= 10;
    step *= 10;
  }
  if (value < 0 && former > 0) return {step, -static_cast<std::int64_t>(former) - 1};
  return {step, static_cast<std::int64_t>(std::min(power, kEnd))};
}

std::optional<SettingRemark> remarkOnFigures(std::uint32_t figures) {
  if (figures == 0) {
    return SettingRemark{false, false,
                         "no figure is kept: every value becomes 0, 1 or a power of ten"};
  }
  if (figures >= 19) {
    return SettingRemark{false, true, "no value has more than 19 digits, so nothing is rounded"};
  }
  return std::nullopt;
}

constexpr WhitelistOption kOptions[] = {
    {"bucket_interval", OptionValue::WholeNumber,
     ScalarRounding{roundToMultiple, gridOfMultiples, remarkOnInterval, nullptr},
     "a scalar is rounded to a multiple of this number, before `sig_fig` applies"},
    {"sig_fig", OptionValue::WholeNumber,
     ScalarRounding{roundToFigures, gridOfFigures, remarkOnFigures, pieceOfFigures},
     "a scalar is rounded to this many significant figures"},
    {kOptionIntervals, OptionValue::Numbers, OptionEffect::onDistributions(),
     "a distribution gets a histogram with these upper bounds"},
};
// Rounding reads whole numbers.
static_assert(std::ranges::all_of(kOptions, [](const WhitelistOption& option) {
  return !option.effect.isForScalars() || option.value == OptionValue::WholeNumber;
}));

std::optional<std::uint32_t> wholeNumber(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  if (number == nullptr) return std::nullopt;
  const double real = number->asDouble();
  if (!(real >= 0 && real <= std::numeric_limits<std::uint32_t>::max())) return std::nullopt;
  if (std::trunc(real) != real) return std::nullopt;
  return number->asUInt32();
}

bool isArrayOfNumbers(const KvObject& value) {
  const auto* array = kvCast<KvArray>(&value);
  return array != nullptr && std::all_of(array->begin(), array->end(), [](const auto& item) {
           return item->type() == KvType::Number;
         });
}

}  // namespace

std::span<const WhitelistOption> whitelistOptions() { return kOptions; }

const WhitelistOption* whitelistOption(std::string_view name) {
  const auto* const found = std::ranges::find(kOptions, name, &WhitelistOption::name);
  return found != std::end(kOptions) ? found : nullptr;
}

std::optional<std::uint32_t> unsignedOption(const ScalarOptions& options, std::string_view name) {
  return wholeNumber(options.get(name));
}

bool isWellFormedOption(std::string_view name, const KvObject& value) {
  const WhitelistOption* const option = whitelistOption(name);
  if (option == nullptr) return true;
  switch (option->value) {
    case OptionValue::WholeNumber:
      return wholeNumber(&value).has_value();
    case OptionValue::Numbers:
      return isArrayOfNumbers(value);
  }
  return false;
}

bool haveEffect(const ScalarOptions& options) {
  return std::ranges::any_of(kOptions, [&options](const WhitelistOption& option) {
    if (!option.effect.isForScalars()) return options.contains(option.name);
    const auto setting = unsignedOption(options, option.name);
    if (!setting) return false;
    const auto remark = option.effect.rounding().remark(*setting);
    return !remark || !remark->isIdle;
  });
}

std::int64_t roundScalar(std::int64_t value, const ScalarOptions& options,
                         std::vector<RoundingStep>* steps) {
  if (options.empty()) return value;
  for (const WhitelistOption& option : kOptions) {
    if (!option.effect.isForScalars()) continue;
    const auto setting = unsignedOption(options, option.name);
    if (!setting) continue;
    const std::int64_t before = value;
    value = option.effect.rounding().round(before, *setting);
    if (steps != nullptr) steps->push_back({option.name, *setting, before, value});
  }
  return value;
}

}  // namespace tally
