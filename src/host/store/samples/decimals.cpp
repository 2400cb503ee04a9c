#include "host/store/samples/decimals.h"

#include <algorithm>
#include <bit>
#include <cfloat>
#include <cmath>

namespace tally {
namespace {

double decimal(std::int64_t digits, std::size_t scale) {
  return static_cast<double>(digits) / kPowersOfTen[scale];
}

// False if the value is not that many digits, or too many. Whatever the product's rounding was, the
// quotient decides.
bool takeDigits(double value, std::size_t scale, std::int64_t& digits) {
  const double scaled = value * kPowersOfTen[scale];
  if (!(std::abs(scaled) < static_cast<double>(kMostDigits))) return false;
  const double half = std::abs(scaled) < 0x1p52 ? std::copysign(0.5, scaled) : 0;
  digits = static_cast<std::int64_t>(scaled + half);
  return sameBits(decimal(digits, scale), value);
}

bool fitsFloat(double value) {
  return (std::abs(value) <= FLT_MAX || !std::isfinite(value)) &&
         sameBits(static_cast<double>(static_cast<float>(value)), value);
}

}  // namespace

bool sameBits(double a, double b) {
  return std::bit_cast<std::uint64_t>(a) == std::bit_cast<std::uint64_t>(b);
}

bool areEqual(std::span<const double> values) {
  return std::ranges::all_of(values, [&](double value) { return sameBits(value, values[0]); });
}

bool fitFloats(std::span<const double> values) { return std::ranges::all_of(values, fitsFloat); }

std::optional<Decimals> decimalsOf(std::span<const double> values) {
  Decimals found;
  std::vector<std::int64_t> digits(values.size());
  // A value that a scale can express has the same bits at each larger one.
  for (std::size_t i = 0; i < values.size(); ++i) {
    const std::size_t before = found.scale;
    while (!takeDigits(values[i], found.scale, digits[i])) {
      if (++found.scale == std::size(kPowersOfTen)) return std::nullopt;
    }
    if (found.scale == before) continue;
    for (std::size_t j = 0; j < i; ++j) {
      // A large one may have no space for further digits.
      if (!takeDigits(values[j], found.scale, digits[j])) return std::nullopt;
    }
  }
  const auto [least, most] = std::ranges::minmax(digits);
  found.least = least;
  found.most = static_cast<std::uint64_t>(most - least);
  found.excess.reserve(values.size());
  for (const std::int64_t number : digits) {
    found.excess.push_back(static_cast<std::uint64_t>(number - least));
  }
  return found;
}

}  // namespace tally
