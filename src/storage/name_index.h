// Finds counter names in constant time, through an index that is made at compile time.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>
#include <type_traits>

namespace tally {

constexpr std::uint64_t nameWord(const char* text, std::size_t count) {
  std::uint64_t word = 0;
  if (std::is_constant_evaluated()) {
    for (std::size_t i = 0; i < count; ++i) {
      word |= std::uint64_t{static_cast<unsigned char>(text[i])} << (8 * i);
    }
  } else {
    std::memcpy(&word, text, count);
  }
  return word;
}

constexpr std::uint32_t nameHash(std::string_view name) {
  constexpr std::uint64_t kMultiplier = 0x9E3779B97F4A7C15;
  std::uint64_t state = name.size();
  std::size_t offset = 0;
  for (; offset + 8 <= name.size(); offset += 8) {
    state = (state ^ nameWord(name.data() + offset, 8)) * kMultiplier;
    state ^= state >> 29;
  }
  state = (state ^ nameWord(name.data() + offset, name.size() - offset)) * kMultiplier;
  return static_cast<std::uint32_t>(state >> 32);
}

constexpr std::size_t kNoRow = static_cast<std::size_t>(-1);

// An index of rows that have a member `name`. Slots is a power of two, well above their number.
template <std::size_t Slots>
class NameIndex {
 public:
  template <class Rows>
  constexpr NameIndex(const Rows& rows, std::size_t count) {
    for (std::size_t row = 0; row < count; ++row) {
      std::size_t slot = nameHash(rows[row].name) % Slots;
      // A name that is there already keeps its first row.
      while (slots_[slot] != 0 && rows[slots_[slot] - 1u].name != rows[row].name) {
        slot = (slot + 1) % Slots;
      }
      if (slots_[slot] == 0) slots_[slot] = static_cast<std::uint16_t>(row + 1);
    }
  }
  // The first row of that name, or kNoRow. The rows are those that the index was made of.
  template <class Rows>
  std::size_t find(const Rows& rows, std::string_view name, std::uint32_t hash) const noexcept {
    for (std::size_t slot = hash % Slots; slots_[slot] != 0; slot = (slot + 1) % Slots) {
      const std::size_t row = slots_[slot] - 1u;
      if (rows[row].name == name) return row;
    }
    return kNoRow;
  }

 private:
  static_assert((Slots & (Slots - 1)) == 0);
  std::array<std::uint16_t, Slots> slots_{};  // row + 1, 0 = free
};

}  // namespace tally
