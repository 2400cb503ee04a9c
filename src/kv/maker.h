// Making values: each is one block of memory, from an arena or the heap.
#pragma once

#include <cstdint>
#include <new>

#include "kv/value.h"

namespace tally {

class KvMaker {
 public:
  // A T followed by space for more bytes, which the value manages.
  template <class T, class... Arguments>
  static KvRef<T> make(KvArena* arena, std::size_t more, Arguments... arguments) {
    const std::size_t size = sizeof(T) + more;
    void* const placed = arena != nullptr ? arena->allocate(size) : nullptr;
    auto* const value = new (placed != nullptr ? placed : ::operator new(size)) T(arguments...);
    value->inArena_ = placed != nullptr;
    return KvRef<T>::adopt(value);
  }

  // A container with space for its first items in its own block.
  template <class T, class Item>
  static KvRef<T> makeContainer(KvArena* arena, std::size_t capacity) {
    // Many items get memory of their own.
    constexpr std::size_t kMostInside = 64;
    const auto inside = static_cast<std::uint32_t>(capacity <= kMostInside ? capacity : 0);
    auto container = make<T>(arena, inside * sizeof(Item), inside);
    return container;
  }
};

}  // namespace tally
