#include "kv/base64.h"

#include <array>
#include <cstdint>

namespace tally {
namespace {

constexpr std::string_view kAlphabet =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kBlank = 0xFE;
constexpr std::uint8_t kForeign = 0xFF;

constexpr std::array<std::uint8_t, 256> kDigits = [] {
  std::array<std::uint8_t, 256> digits{};
  digits.fill(kForeign);
  for (const char blank : {' ', '\t', '\r', '\n'})
    digits[static_cast<std::uint8_t>(blank)] = kBlank;
  for (std::size_t i = 0; i < kAlphabet.size(); ++i) {
    digits[static_cast<std::uint8_t>(kAlphabet[i])] = static_cast<std::uint8_t>(i);
  }
  return digits;
}();

}  // namespace

void appendBase64(std::string& out, std::span<const std::byte> bytes) {
  for (std::size_t i = 0; i < bytes.size(); i += 3) {
    const auto byte = [&](std::size_t k) {
      return i + k < bytes.size() ? std::to_integer<std::uint32_t>(bytes[i + k]) : 0u;
    };
    const std::uint32_t group = byte(0) << 16 | byte(1) << 8 | byte(2);
    out += kAlphabet[group >> 18];
    out += kAlphabet[group >> 12 & 63];
    out += i + 1 < bytes.size() ? kAlphabet[group >> 6 & 63] : '=';
    out += i + 2 < bytes.size() ? kAlphabet[group & 63] : '=';
  }
}

std::optional<std::vector<std::byte>> decodeBase64(std::string_view text) {
  std::vector<std::byte> bytes;
  bytes.reserve(text.size() / 4 * 3);
  std::uint32_t bits = 0;
  std::size_t digits = 0;
  std::size_t padding = 0;
  for (const char character : text) {
    const std::uint8_t digit = kDigits[static_cast<std::uint8_t>(character)];
    if (digit == kBlank) continue;
    if (character == '=') {
      ++padding;
      continue;
    }
    if (digit == kForeign || padding != 0) return std::nullopt;
    bits = bits << 6 | digit;
    // From the second digit of a group on, each one completes a byte.
    if (digits % 4 != 0) {
      bytes.push_back(static_cast<std::byte>(bits >> (6 - 2 * (digits % 4)) & 0xFF));
    }
    ++digits;
  }
  const std::size_t rest = digits % 4;
  if (rest == 1 || padding > 2 || (padding != 0 && (rest + padding) != 4)) return std::nullopt;
  return bytes;
}

}  // namespace tally
