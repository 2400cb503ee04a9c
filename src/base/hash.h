// The hash of tables whose keys came from outside.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

namespace tally {

// Seeded once per process, so that a document made to collide costs no more than any other.
std::uint32_t hashBytes(std::string_view bytes) noexcept;
std::uint32_t hashWords(std::span<const std::uint64_t> words) noexcept;

// Finds entries, kept elsewhere under the numbers 0, 1, …, by their hashes. The hashes lie in the
// index itself, so that neither a miss nor growing touches an entry.
class HashIndex {
 public:
  static constexpr std::uint32_t kNone = UINT32_MAX;

  bool empty() const noexcept { return slots_.empty(); }
  void clear() noexcept {
    slots_.clear();
    used_ = 0;
  }
  // The entry of this hash for which isSame(number) holds; kNone when there is none.
  template <class IsSame>
  std::uint32_t find(std::uint32_t hash, const IsSame& isSame) const {
    if (slots_.empty()) return kNone;
    const std::size_t mask = slots_.size() - 1;
    for (std::size_t i = hash & mask; slots_[i].number != kNone; i = (i + 1) & mask) {
      if (slots_[i].hash == hash && isSame(slots_[i].number)) return slots_[i].number;
    }
    return kNone;
  }
  // Room for so many entries without growing.
  void reserve(std::size_t entries) {
    if (entries * 4 > slots_.size() * 3) grow(std::bit_ceil(entries * 3 / 2 + 8));
  }
  // REQUIRES: the entry is not there yet.
  void add(std::uint32_t hash, std::uint32_t number) {
    // At most three quarters full, so that a search stays short.
    if ((used_ + 1) * 4 > slots_.size() * 3) grow(slots_.empty() ? 32 : slots_.size() * 2);
    place({hash, number});
    ++used_;
  }

 private:
  struct Slot {
    std::uint32_t hash = 0;
    std::uint32_t number = kNone;
  };
  void place(Slot slot) {
    const std::size_t mask = slots_.size() - 1;
    std::size_t i = slot.hash & mask;
    while (slots_[i].number != kNone) i = (i + 1) & mask;
    slots_[i] = slot;
  }
  void grow(std::size_t size) {
    std::vector<Slot> former(size);
    former.swap(slots_);
    for (const Slot& slot : former) {
      if (slot.number != kNone) place(slot);
    }
  }
  std::vector<Slot> slots_;  // open addressing
  std::size_t used_ = 0;
};

}  // namespace tally
