#include "storage/counter_memory.h"

#include <algorithm>
#include <new>

#include "storage/statistics.h"

namespace tally {
namespace {

struct Block {
  Block* former;
  std::size_t size;  // with this head
  std::size_t used;
};

// A few counters cost a page; larger blocks would go back to the system with every release.
constexpr std::size_t kFirstBlock = std::size_t{4} << 10;
constexpr std::size_t kLargestBlock = std::size_t{64} << 10;

Block* addBlock(Block* former) noexcept {
  const std::size_t size =
      former == nullptr ? kFirstBlock : std::min(former->size * 2, kLargestBlock);
  void* memory = ::operator new(size, std::nothrow);
  return memory == nullptr ? nullptr : new (memory) Block{former, size, sizeof(Block)};
}

}  // namespace

void* allocateInContext(SPXParseContext& context, std::size_t size) noexcept {
  size = (size + alignof(void*) - 1) / alignof(void*) * alignof(void*);
  auto* block = static_cast<Block*>(context.memory);
  if (block == nullptr || size > block->size - block->used) {
    block = addBlock(block);
    if (block == nullptr) return nullptr;
    context.memory = block;
  }
  void* room = reinterpret_cast<std::byte*>(block) + block->used;
  block->used += size;
  return room;
}

void freeContextMemory(SPXParseContext& context) noexcept {
  for (auto* block = static_cast<Block*>(context.memory); block != nullptr;) {
    Block* const former = block->former;
    ::operator delete(block);
    block = former;
  }
  context.memory = nullptr;
}

}  // namespace tally
