// Expresses a value in another unit.
#include "hwreport/values.h"

#include <limits>

#include "hwreport/values/unit_word.h"

namespace tally {
namespace {

constexpr std::uint32_t kFactorDivides = 0x80000000;
constexpr int kExponentBias = 127;
constexpr auto kLargest = std::numeric_limits<std::uint64_t>::max();

// A unit as a fraction of its plain quantity. What does not fit saturates.
struct Ratio {
  std::uint64_t multiplier = 1;
  std::uint64_t divisor = 1;
};

std::uint64_t timesTenTo(std::uint64_t value, int exponent) {
  for (; exponent > 0 && value != kLargest; --exponent) {
    if (__builtin_mul_overflow(value, std::uint64_t{10}, &value)) value = kLargest;
  }
  return value;
}

std::uint64_t shifted(std::uint64_t value, int bits) {
  return bits > 63 || value > kLargest >> bits ? kLargest : value << bits;
}

// Applies an exponent byte to the numerator or the denominator, by its sign.
template <class Apply>
void applyExponent(std::uint8_t byte, Ratio* ratio, Apply apply) {
  if (byte == 0) return;
  const int exponent{static_cast<std::int8_t>(byte - kExponentBias)};
  std::uint64_t& side = exponent >= 0 ? ratio->multiplier : ratio->divisor;
  side = apply(side, exponent >= 0 ? exponent : -exponent);
}

Ratio ratioOf(const UnitWord& unit) {
  Ratio ratio;
  if (const std::uint32_t magnitude = unit.factor() & ~kFactorDivides; magnitude != 0) {
    ((unit.factor() & kFactorDivides) != 0 ? ratio.divisor : ratio.multiplier) = magnitude;
  }
  applyExponent(unit.decimalExponent(), &ratio, timesTenTo);
  applyExponent(unit.binaryExponent(), &ratio, shifted);
  return ratio;
}

}  // namespace

double HwReportScaleValue(std::uint64_t value, std::uint64_t fromUnit, std::uint64_t toUnit) {
  const UnitWord from{fromUnit}, to{toUnit};
  if (from.quantity() != to.quantity() || from.kind() != 0 || to.kind() != 0) {
    return std::numeric_limits<double>::quiet_NaN();
  }
  const Ratio fromRatio = ratioOf(from), toRatio = ratioOf(to);
  return static_cast<double>(value) * static_cast<double>(fromRatio.multiplier) /
         static_cast<double>(fromRatio.divisor) / static_cast<double>(toRatio.multiplier) *
         static_cast<double>(toRatio.divisor);
}

}  // namespace tally
