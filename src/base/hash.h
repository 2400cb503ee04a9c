// Hash tables whose keys are untrusted input.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "base/large_memory.h"

namespace tally {

// Seeded once per process, so that a document made to collide costs no more than any other.
std::uint32_t hashBytes(std::string_view bytes) noexcept;
std::uint32_t hashWords(std::span<const std::uint64_t> words) noexcept;

// Finds entries, which are kept elsewhere and numbered, by their hashes: an open-addressing table.
// It stores the hashes itself, so that neither a miss nor growing touches an entry.
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
    return slots_.empty() ? kNone : slots_[slotOf(hash, isSame)].number;
  }
  // The number of some entry of this hash, without a look at the entries; kNone when there is none.
  std::uint32_t findHash(std::uint32_t hash) const {
    return find(hash, [](std::uint32_t) { return true; });
  }
  // The same as find(); when there is none, this one is added and kNone is returned.
  template <class IsSame>
  std::uint32_t findOrAdd(std::uint32_t hash, std::uint32_t number, const IsSame& isSame) {
    makeSpace();
    Slot& slot = slots_[slotOf(hash, isSame)];
    if (slot.number != kNone) return slot.number;
    slot = {hash, number};
    ++used_;
    return kNone;
  }
  // Has the slot of the hash fetched into the cache. REQUIRES: the index has capacity.
  void prefetch(std::uint32_t hash) const {
    __builtin_prefetch(&slots_[hash & (slots_.size() - 1)]);
  }
  // Makes the capacity for so many entries.
  void reserve(std::size_t entries) {
    if (entries * 4 > slots_.size() * 3) grow(std::bit_ceil(entries * 3 / 2 + 8));
  }
  // REQUIRES: the entry is not there yet.
  void add(std::uint32_t hash, std::uint32_t number) {
    makeSpace();
    slots_[slotOf(hash, [](std::uint32_t) { return false; })] = {hash, number};
    ++used_;
  }

 private:
  struct Slot {
    std::uint32_t hash = 0;
    std::uint32_t number = kNone;
  };
  // The slot of the entry for which isSame holds, or the free one where it belongs.
  template <class IsSame>
  std::size_t slotOf(std::uint32_t hash, const IsSame& isSame) const {
    const std::size_t mask = slots_.size() - 1;
    std::size_t i = hash & mask;
    while (slots_[i].number != kNone && !(slots_[i].hash == hash && isSame(slots_[i].number))) {
      i = (i + 1) & mask;
    }
    return i;
  }
  // At most three quarters full, so that a search stays short.
  void makeSpace() {
    if ((used_ + 1) * 4 > slots_.size() * 3) grow(slots_.empty() ? 32 : slots_.size() * 2);
  }
  void grow(std::size_t size) {
    Slots former(size);
    former.swap(slots_);
    for (const Slot& slot : former) {
      if (slot.number != kNone)
        slots_[slotOf(slot.hash, [](std::uint32_t) { return false; })] = slot;
    }
  }
  using Slots = std::vector<Slot, LargeAllocator<Slot>>;
  Slots slots_;  // as many as a power of two
  std::size_t used_ = 0;
};

}  // namespace tally
