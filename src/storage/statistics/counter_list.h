// The counters of a parse context: blocks that are filled one after the other.
#pragma once

#include <cstdint>

#include "storage/statistics.h"

namespace tally {

// Appends a block with free capacity; false when memory runs out.
bool addCounterBlock(SPXParseContext& context) noexcept;

// False when memory runs out; then no counter was added.
inline bool appendCounter(SPXParseContext& context, std::uint16_t name, std::uint64_t value) {
  SPXCounterBlock* block = context.lastBlock;
  if (block == nullptr || block->count == block->capacity) {
    if (!addCounterBlock(context)) return false;
    block = context.lastBlock;
  }
  block->values()[block->count] = value;
  block->names()[block->count++] = name;
  return true;
}

void freeCounters(SPXParseContext& context) noexcept;

}  // namespace tally
