#include "storage/statistics/counter_list.h"

#include <algorithm>
#include <new>

namespace tally {
namespace {

constexpr std::size_t kCounterSize = sizeof(std::uint64_t) + sizeof(std::uint16_t);
// Each block is twice as large as the previous one, so that few counters take little memory and
// many take few blocks.
constexpr std::uint32_t kFirstCapacity = 400;
constexpr std::uint32_t kLargestCapacity = 6400;

}  // namespace

bool addCounterBlock(SPXParseContext& context) noexcept {
  const std::uint32_t capacity = context.lastBlock == nullptr
                                     ? kFirstCapacity
                                     : std::min(context.lastBlock->capacity * 2, kLargestCapacity);
  void* memory = ::operator new(sizeof(SPXCounterBlock) + capacity * kCounterSize, std::nothrow);
  if (memory == nullptr) return false;
  auto* block = new (memory) SPXCounterBlock{nullptr, 0, capacity};
  (context.lastBlock == nullptr ? context.firstBlock : context.lastBlock->next) = block;
  context.lastBlock = block;
  return true;
}

void freeCounters(SPXParseContext& context) noexcept {
  for (SPXCounterBlock* block = context.firstBlock; block != nullptr;) {
    SPXCounterBlock* const next = block->next;
    ::operator delete(block);
    block = next;
  }
  context.firstBlock = context.lastBlock = nullptr;
}

}  // namespace tally
