#include "kv/arena.h"

#include <new>

#include "base/large_memory.h"
#include "kv/value.h"

namespace tally {
namespace {

constexpr std::size_t kHeapFirst = kLargePage / 2;
constexpr std::size_t kLargestValue = kLargePage / 8;
constexpr std::size_t kAlignment = alignof(std::max_align_t);
// What a chunk counts while values are still being made in it.
constexpr std::uint32_t kOpen = 1u << 31;

// One chunk is kept for the next arena: samples are mostly taken again and again.
std::atomic<void*> spare{nullptr};

}  // namespace

struct alignas(64) KvArena::Chunk {
  std::atomic<std::uint32_t> values{kOpen};
};

void* KvArena::allocate(std::size_t size) {
  size = (size + kAlignment - 1) / kAlignment * kAlignment;
  if (size > kLargestValue) return nullptr;
  if (fromHeap_ < kHeapFirst) {
    fromHeap_ += size;
    return nullptr;
  }
  if (chunk_ == nullptr || used_ + size > kLargePage) {
    close();
    void* memory = spare.exchange(nullptr, std::memory_order_acquire);
    if (memory == nullptr) memory = allocateLarge(kLargePage);
    chunk_ = new (memory) Chunk();
    used_ = sizeof(Chunk);
    values_ = 0;
  }
  void* const value = reinterpret_cast<std::byte*>(chunk_) + used_;
  used_ += size;
  ++values_;
  return value;
}

void KvArena::close() noexcept {
  if (chunk_ != nullptr) drop(chunk_, kOpen - values_);
  chunk_ = nullptr;
}

void KvArena::release(void* value) noexcept {
  // Chunks are aligned to their size.
  const auto address = reinterpret_cast<std::uintptr_t>(value) / kLargePage * kLargePage;
  drop(reinterpret_cast<Chunk*>(address), 1);
}

void KvArena::drop(Chunk* chunk, std::uint32_t values) noexcept {
  if (kvSingleThreaded()) {
    const std::uint32_t left = chunk->values.load(std::memory_order_relaxed) - values;
    chunk->values.store(left, std::memory_order_relaxed);
    if (left != 0) return;
  } else if (chunk->values.fetch_sub(values, std::memory_order_acq_rel) != values) {
    return;
  }
  void* const former = spare.exchange(chunk, std::memory_order_acq_rel);
  if (former != nullptr) freeLarge(former, kLargePage);
}

}  // namespace tally
