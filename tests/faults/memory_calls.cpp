// The allocations of the program and of the C++ library, one of which may fail.
#include <cstdlib>
#include <new>

#include "faults/fault.h"

namespace {

void* allocate(std::size_t bytes, std::size_t alignment) {
  if (tally::faults::memoryRunsOut("new")) return nullptr;
  const std::size_t rounded = (bytes + alignment) / alignment * alignment;  // never none
  return std::aligned_alloc(alignment, rounded);
}

void* allocateOrThrow(std::size_t bytes, std::size_t alignment) {
  if (void* const memory = allocate(bytes, alignment)) return memory;
  throw std::bad_alloc();
}

constexpr std::size_t kUsual = __STDCPP_DEFAULT_NEW_ALIGNMENT__;

}  // namespace

// The C++ library's forms for arrays call these. Its forms that do not throw would too, but not
// those of the address sanitizer, which then sees memory of one kind released as another.
void* operator new(std::size_t bytes) { return allocateOrThrow(bytes, kUsual); }
void* operator new(std::size_t bytes, std::align_val_t alignment) {
  return allocateOrThrow(bytes, static_cast<std::size_t>(alignment));
}
void* operator new(std::size_t bytes, const std::nothrow_t&) noexcept {
  return allocate(bytes, kUsual);
}
void* operator new(std::size_t bytes, std::align_val_t alignment, const std::nothrow_t&) noexcept {
  return allocate(bytes, static_cast<std::size_t>(alignment));
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }
void operator delete(void* memory, std::align_val_t) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t, std::align_val_t) noexcept { std::free(memory); }
