// Integers in as few bytes as they need: seven bits a byte, the lowest first; the last byte is
// below 0x80. For what a process keeps in its own memory, not for input.
#pragma once

#include <cstddef>
#include <cstdint>

namespace tally {

constexpr std::size_t kLongestVarint = 10;

// Makes numbers near 0 of either sign small.
constexpr std::uint64_t zigzag(std::int64_t value) {
  return (static_cast<std::uint64_t>(value) << 1) ^ static_cast<std::uint64_t>(value >> 63);
}
constexpr std::int64_t unzigzag(std::uint64_t value) {
  return static_cast<std::int64_t>(value >> 1) ^ -static_cast<std::int64_t>(value & 1);
}

// Returns the end of what was written. REQUIRES: space for kLongestVarint bytes.
inline std::byte* putVarint(std::byte* out, std::uint64_t value) {
  for (; value >= 0x80; value >>= 7) *out++ = static_cast<std::byte>(value | 0x80);
  *out++ = static_cast<std::byte>(value);
  return out;
}

// take() gives the next byte. REQUIRES: what putVarint() wrote.
template <class Take>
std::uint64_t takeVarint(const Take& take) {
  std::uint64_t value = 0;
  for (unsigned shift = 0;; shift += 7) {
    const auto byte = static_cast<std::uint64_t>(take());
    value |= (byte & 0x7f) << shift;
    if (byte < 0x80) return value;
  }
}

}  // namespace tally
