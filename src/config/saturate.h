// Conversion of doubles to integers that is defined for every double.
#pragma once

#include <cstdint>
#include <limits>

namespace tally {

// Truncated toward zero; the nearer end outside the range, 0 for a NaN.
inline std::int64_t saturatedInt64(double value) {
  constexpr double kEnd = 9223372036854775808.0;  // 2 to the 63rd, exact; the maximum itself is not
  if (value >= kEnd) return std::numeric_limits<std::int64_t>::max();
  if (value <= -kEnd) return std::numeric_limits<std::int64_t>::min();
  return value == value ? static_cast<std::int64_t>(value) : 0;
}

}  // namespace tally
