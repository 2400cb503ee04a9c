// The memory of a parse context: blocks that are handed out in pieces and freed together.
#pragma once

#include <cstddef>

namespace tally {

struct SPXParseContext;

// Room for a node or a text, aligned for a pointer; null when memory runs out. Two allocations a
// counter would cost more than all else that a parse does.
void* allocateInContext(SPXParseContext& context, std::size_t size) noexcept;

void freeContextMemory(SPXParseContext& context) noexcept;

}  // namespace tally
