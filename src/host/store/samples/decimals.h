// Floating-point numbers as whole numbers of decimal units, where that is exact.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

namespace tally {

inline constexpr double kPowersOfTen[] = {1, 10, 100, 1000, 1e4, 1e5, 1e6};

inline constexpr std::int64_t kMostDigits = std::int64_t{1} << 53;  // below it each has its double

// Each value is (least + excess) / 10^scale, bit for bit; all digits are below kMostDigits.
struct Decimals {
  std::size_t scale = 0;  // the least that all values have
  std::int64_t least = 0;
  std::vector<std::uint64_t> excess;
  std::uint64_t most = 0;  // of the excesses
};
// Empty when a value has no such form. REQUIRES: one value at least.
std::optional<Decimals> decimalsOf(std::span<const double> values);

bool sameBits(double a, double b);
// Whether all have the first one's bits.
bool areEqual(std::span<const double> values);
// Whether each comes back from a 32-bit floating-point number bit for bit.
bool fitFloats(std::span<const double> values);

}  // namespace tally
