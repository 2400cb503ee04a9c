// The unit word: factor, exponents, kind and quantity.
#pragma once

#include <cstdint>

namespace tally {

struct UnitWord {
  std::uint64_t bits = 0;
  std::uint32_t factor() const noexcept { return static_cast<std::uint32_t>(bits); }
  // Exponents are biased by 127; 0 is none.
  std::uint8_t decimalExponent() const noexcept { return static_cast<std::uint8_t>(bits >> 32); }
  std::uint8_t binaryExponent() const noexcept { return static_cast<std::uint8_t>(bits >> 40); }
  // Not 0: a unit of its own kind that cannot be scaled.
  std::uint8_t kind() const noexcept { return static_cast<std::uint8_t>(bits >> 48); }
  std::uint8_t quantity() const noexcept { return static_cast<std::uint8_t>(bits >> 56); }
  // Exponents and kind together.
  std::uint32_t scale() const noexcept { return static_cast<std::uint32_t>(bits >> 32) & 0xFFFFFF; }
};

constexpr std::uint64_t kUnitSeconds = 0x0100000000000000;

}  // namespace tally
