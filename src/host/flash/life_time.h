// The scale of JEDEC on which eMMC and UFS report their life.
#pragma once

#include <charconv>
#include <optional>
#include <string_view>

#include "platform/flash/wear.h"

namespace tally {

// A byte in hexadecimal, with or without 0x; the whole text.
inline std::optional<unsigned> parseHexByte(std::string_view text) {
  if (text.starts_with("0x") || text.starts_with("0X")) text.remove_prefix(2);
  unsigned value = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), value, 16);
  const bool whole = error == std::errc() && end == text.data() + text.size();
  return whole && value <= 0xFF ? std::optional(value) : std::nullopt;
}

// 1 to 10 are steps of ten percent, 11 is beyond the rated life; 0 is undefined, the rest reserved.
constexpr std::optional<PercentRange> usedOfLifeTime(unsigned code) {
  constexpr unsigned kExceeded = 11;
  if (code == 0 || code > kExceeded) return std::nullopt;
  if (code == kExceeded) return PercentRange{100, std::nullopt};
  return PercentRange{(code - 1) * 10, code * 10};
}

// 1: less than 80 % of the reserve is used, 2: 80 %, 3: 90 %; 0 is undefined.
constexpr std::optional<PercentRange> spareOfPreEndOfLife(unsigned code) {
  constexpr PercentRange kLeft[] = {{20, 100}, {10, 20}, {0, 10}};
  return code >= 1 && code <= 3 ? std::optional(kLeft[code - 1]) : std::nullopt;
}

template <class T>
Figure<T> reported(const std::optional<T>& value, std::string_view origin) {
  return value ? Figure<T>({*value, origin}) : std::nullopt;
}

}  // namespace tally
