// Hexadecimal digits.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace tally {

constexpr std::string_view kLowerHexDigits = "0123456789abcdef";
constexpr std::string_view kUpperHexDigits = "0123456789ABCDEF";

// The low digits of the value, with leading zeros.
inline void appendHex(std::string& out, std::uint64_t value, int digits,
                      std::string_view alphabet = kLowerHexDigits) {
  for (int shift = 4 * (digits - 1); shift >= 0; shift -= 4) out += alphabet[value >> shift & 15];
}

// The value of one digit of either case; empty for any other character.
constexpr std::optional<unsigned> hexDigitValue(char digit) {
  if (digit >= '0' && digit <= '9') return static_cast<unsigned>(digit - '0');
  if (digit >= 'a' && digit <= 'f') return static_cast<unsigned>(digit - 'a' + 10);
  if (digit >= 'A' && digit <= 'F') return static_cast<unsigned>(digit - 'A' + 10);
  return std::nullopt;
}

}  // namespace tally
