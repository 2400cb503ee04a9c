// Memory for large buffers. Touching fresh memory page by page can cost more than the work done in
// it, so it is requested in huge pages where the kernel has them.
#pragma once

#include <cstddef>
#include <new>

namespace tally {

constexpr std::size_t kLargePage = 2u << 20;

// At least size bytes, aligned to kLargePage. Throws std::bad_alloc.
void* allocateLarge(std::size_t size);
void freeLarge(void* memory, std::size_t size) noexcept;

// From this size on a container's memory is worth a whole large page.
constexpr std::size_t kWorthLarge = kLargePage / 4;

// Either kind by size, for containers; freed with the same size.
inline void* allocateSized(std::size_t size) {
  return size >= kWorthLarge ? allocateLarge(size) : ::operator new(size);
}
inline void freeSized(void* memory, std::size_t size) noexcept {
  if (size >= kWorthLarge) {
    freeLarge(memory, size);
  } else {
    ::operator delete(memory);
  }
}

template <class T>
struct LargeAllocator {
  using value_type = T;
  LargeAllocator() = default;
  template <class U>
  LargeAllocator(const LargeAllocator<U>&) {}
  T* allocate(std::size_t count) { return static_cast<T*>(allocateSized(count * sizeof(T))); }
  void deallocate(T* memory, std::size_t count) noexcept { freeSized(memory, count * sizeof(T)); }
  bool operator==(const LargeAllocator&) const = default;
};

}  // namespace tally
