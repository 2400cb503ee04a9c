#include "base/large_memory.h"

#include <sys/mman.h>

#include <cstdint>
#include <new>

namespace tally {
namespace {

constexpr std::size_t rounded(std::size_t size) {
  return (size + kLargePage - 1) / kLargePage * kLargePage;
}

}  // namespace

void* allocateLarge(std::size_t size) {
  if (size > SIZE_MAX / 2) throw std::bad_alloc();
  // One page more than asked, so that an aligned range lies inside; the rest goes back.
  const std::size_t wanted = rounded(size);
  void* const mapped = ::mmap(nullptr, wanted + kLargePage, PROT_READ | PROT_WRITE,
                              MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
  if (mapped == MAP_FAILED) throw std::bad_alloc();
  auto* const start = static_cast<std::byte*>(mapped);
  const std::size_t before =
      rounded(reinterpret_cast<std::uintptr_t>(start)) - reinterpret_cast<std::uintptr_t>(start);
  std::byte* const aligned = start + before;
  if (before != 0) ::munmap(start, before);
  if (before != kLargePage) ::munmap(aligned + wanted, kLargePage - before);
  ::madvise(aligned, wanted, MADV_HUGEPAGE);  // if this fails, small pages are used
  return aligned;
}

void freeLarge(void* memory, std::size_t size) noexcept { ::munmap(memory, rounded(size)); }

}  // namespace tally
