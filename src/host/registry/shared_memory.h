// Shared memory: the owner writes it, the others map it read-only.
#pragma once

#include <cstddef>
#include <memory>
#include <span>

namespace tally {

class SharedMemory {
 public:
  // Null when there is no memory.
  static std::unique_ptr<SharedMemory> create(std::size_t size);
  ~SharedMemory();
  SharedMemory(const SharedMemory&) = delete;
  SharedMemory& operator=(const SharedMemory&) = delete;

  std::span<std::byte> writable() const { return {writable_, size_}; }
  // A further mapping for reading; null when there is none. Undone by unmap() with its address.
  const std::byte* map() const;
  void unmap(const std::byte* address) const;

 private:
  SharedMemory(int descriptor, std::byte* writable, std::size_t size)
      : descriptor_(descriptor), writable_(writable), size_(size) {}
  const int descriptor_;
  std::byte* const writable_;
  const std::size_t size_;
};

}  // namespace tally
