// Finds names in constant time, at compile time.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace tally {

constexpr std::uint16_t kNoRow = 0xFFFF;

// An index of rows that have a member `name`. Slots is a power of two, well above their number.
template <std::size_t Slots>
class NameIndex {
 public:
  template <class Rows>
  constexpr NameIndex(const Rows& rows, std::size_t count) {
    slots_.fill(kNoRow);
    for (std::size_t row = 0; row < count; ++row) {
      std::size_t slot = slotOf(rows[row].name);
      // A name that is there already keeps its first row.
      while (slots_[slot] != kNoRow && rows[slots_[slot]].name != rows[row].name) {
        slot = (slot + 1) % Slots;
      }
      if (slots_[slot] == kNoRow) slots_[slot] = static_cast<std::uint16_t>(row);
    }
  }
  // The first row of that name, or kNoRow. The rows are those that the index was made of.
  template <class Rows>
  constexpr std::uint16_t find(const Rows& rows, std::string_view name) const {
    std::size_t slot = slotOf(name);
    while (slots_[slot] != kNoRow && rows[slots_[slot]].name != name) slot = (slot + 1) % Slots;
    return slots_[slot];
  }

 private:
  static_assert((Slots & (Slots - 1)) == 0);
  static constexpr std::size_t slotOf(std::string_view name) {
    std::uint32_t hash = 0x811C9DC5;
    for (const char letter : name) {
      hash = (hash ^ static_cast<unsigned char>(letter)) * 0x01000193;
    }
    return (hash ^ (hash >> 15)) % Slots;
  }
  std::array<std::uint16_t, Slots> slots_{};
};

}  // namespace tally
