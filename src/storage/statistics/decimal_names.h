// Builds numbered names at compile time.
#pragma once

#include <cstddef>
#include <string_view>

namespace tally {

constexpr std::size_t decimalDigits(unsigned value) {
  std::size_t digits = 1;
  for (; value >= 10; value /= 10) ++digits;
  return digits;
}

// Both write at `to`, without a zero byte, and return the end.
constexpr char* appendText(char* to, std::string_view text) {
  for (const char letter : text) *to++ = letter;
  return to;
}
constexpr char* appendDecimal(char* to, unsigned value) {
  const std::size_t digits = decimalDigits(value);
  for (std::size_t i = digits; i > 0; value /= 10) to[--i] = static_cast<char>('0' + value % 10);
  return to + digits;
}

}  // namespace tally
