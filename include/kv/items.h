// KvItems: the items of an array or the entries of a dictionary.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <utility>

#include "kv/export.h"

namespace tally {

// Memory for items, in large pages when there are many.
TALLY_API void* kvAllocateItems(std::size_t size);
TALLY_API void kvFreeItems(void* memory, std::size_t size) noexcept;

// A growing sequence whose first items lie in its owner's own block of memory, so that a small
// container is one block. Items never move while they fit.
template <class T>
class KvItems {
 public:
  // Space for items after the owner, in the owner's block.
  KvItems(void* room, std::uint32_t capacity) noexcept
      : items_(static_cast<T*>(room)), capacity_(capacity & kMostItems) {}
  KvItems(const KvItems&) = delete;
  KvItems& operator=(const KvItems&) = delete;
  ~KvItems() {
    std::destroy(begin(), end());
    freeOwn();
  }

  std::size_t size() const noexcept { return size_; }
  std::size_t capacity() const noexcept { return capacity_; }
  bool empty() const noexcept { return size_ == 0; }
  T* begin() const noexcept { return items_; }
  T* end() const noexcept { return items_ + size_; }
  T& operator[](std::size_t index) const noexcept { return items_[index]; }

  void reserve(std::size_t capacity) {
    if (capacity > capacity_) grow(capacity);
  }
  void push_back(T item) {
    if (size_ == capacity_) grow(size_ < 4 ? 4 : std::size_t{size_} * 2);
    new (items_ + size_) T(std::move(item));
    ++size_;
  }
  // Adds copies. REQUIRES: there is capacity for them.
  void appendWithinRoom(const KvItems& other) {
    std::uninitialized_copy(other.begin(), other.end(), end());
    size_ += other.size_;
  }
  // Removes the items of which the predicate is true; it sees each once, in order.
  template <class Predicate>
  std::size_t removeIf(Predicate predicate) {
    T* kept = begin();
    for (T* item = begin(); item != end(); ++item) {
      if (predicate(*item)) continue;
      if (kept != item) *kept = std::move(*item);
      ++kept;
    }
    const auto removed = static_cast<std::uint32_t>(end() - kept);
    std::destroy(kept, end());
    size_ -= removed;
    return removed;
  }
  void removeAt(std::size_t index) {
    std::move(begin() + index + 1, end(), begin() + index);
    std::destroy_at(end() - 1);
    --size_;
  }

 private:
  void grow(std::size_t capacity) {
    // Where sizes have 32 bits, the product may not fit.
    if (capacity > std::min<std::uint64_t>(kMostItems, SIZE_MAX / sizeof(T)))
      throw std::bad_alloc();
    auto* const moved = static_cast<T*>(kvAllocateItems(capacity * sizeof(T)));
    std::uninitialized_move(begin(), end(), moved);
    std::destroy(begin(), end());
    freeOwn();
    items_ = moved;
    capacity_ = static_cast<std::uint32_t>(capacity) & kMostItems;
    own_ = true;
  }
  void freeOwn() noexcept {
    if (own_) kvFreeItems(items_, std::size_t{capacity_} * sizeof(T));
  }
  static constexpr std::uint32_t kMostItems = (1u << 31) - 1;
  T* items_;
  std::uint32_t size_ = 0;
  std::uint32_t capacity_ : 31;
  std::uint32_t own_ : 1 = 0;  // the items lie in memory of their own
};

}  // namespace tally
