#include "host/registry/shared_memory.h"

#include <sys/mman.h>
#include <unistd.h>

namespace tally {

std::unique_ptr<SharedMemory> SharedMemory::create(std::size_t size) {
  const int descriptor = memfd_create("tallyrun-hub", MFD_CLOEXEC);
  if (descriptor < 0) return nullptr;
  void* address = MAP_FAILED;
  if (ftruncate(descriptor, static_cast<off_t>(size)) == 0) {
    address = mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor, 0);
  }
  if (address == MAP_FAILED) {
    close(descriptor);
    return nullptr;
  }
  return std::unique_ptr<SharedMemory>(
      new SharedMemory(descriptor, static_cast<std::byte*>(address), size));
}

SharedMemory::~SharedMemory() {
  munmap(writable_, size_);
  close(descriptor_);
}

const std::byte* SharedMemory::map() const {
  void* const address = mmap(nullptr, size_, PROT_READ, MAP_SHARED, descriptor_, 0);
  return address != MAP_FAILED ? static_cast<const std::byte*>(address) : nullptr;
}

void SharedMemory::unmap(const std::byte* address) const {
  munmap(const_cast<std::byte*>(address), size_);
}

}  // namespace tally
