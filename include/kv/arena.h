// KvArena: where many values are made at once.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "kv/export.h"

namespace tally {

// Values that are made together and mostly die together, such as the channels of a sample, lie side
// by side in large chunks: no heap call for each, and few pages to be touched. The first ones still
// come from the heap, so that a few values do not take a whole chunk. A chunk is freed with the
// last value in it, which may outlive the arena. An arena is used by one thread.
class TALLY_API KvArena {
 public:
  KvArena() noexcept = default;
  KvArena(const KvArena&) = delete;
  KvArena& operator=(const KvArena&) = delete;
  ~KvArena() { close(); }

  // Room for a value; null when it is to come from the heap.
  void* allocate(std::size_t size);
  // Gives back what allocate() returned, from any thread.
  static void release(void* value) noexcept;

 private:
  struct Chunk;
  void close() noexcept;
  static void drop(Chunk* chunk, std::uint32_t values) noexcept;
  Chunk* chunk_ = nullptr;
  std::size_t used_ = 0;      // bytes of the chunk
  std::uint32_t values_ = 0;  // made in the chunk
  std::size_t fromHeap_ = 0;  // bytes left to the heap so far
};

}  // namespace tally
