// The driver's statistics buffer: what is parsed from it, and how its counters are reported.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include "kv/export.h"

namespace tally {

// Counters of a context, in the order of the buffer: `count` values, and for each the number of its
// name. capacity values and as many numbers follow the block's head, in one piece of memory.
struct alignas(std::uint64_t) SPXCounterBlock {
  SPXCounterBlock* next;  // null at the end
  std::uint32_t count;
  std::uint32_t capacity;

  std::uint64_t* values() noexcept { return reinterpret_cast<std::uint64_t*>(this + 1); }
  const std::uint64_t* values() const noexcept {
    return reinterpret_cast<const std::uint64_t*>(this + 1);
  }
  std::uint16_t* names() noexcept { return reinterpret_cast<std::uint16_t*>(values() + capacity); }
  const std::uint16_t* names() const noexcept {
    return reinterpret_cast<const std::uint16_t*>(values() + capacity);
  }
};

// The counter's name of that number; a zero byte follows. It lives as long as the program.
TALLY_API std::string_view SPXCounterName(std::uint16_t number) noexcept;

// The result of a parse. The caller owns it, starts with an empty one ({}) and passes it to
// SPXReleaseContext at the end; a copy would own the same memory twice.
struct SPXParseContext {
  std::uint32_t exportVersion = 0;  // 0 after a parse that failed
  std::uint32_t driverVersion = 0;  // all ones after a parse: no record carries it
  std::array<std::uint32_t, 2> reserved{};

  std::uint32_t numVirtualBlocks = 0;
  std::uint32_t blocksPerVirtualBlock = 0;
  std::uint32_t pagesPerVirtualBlock = 0;
  std::uint32_t bytesPerPage = 0;

  std::uint64_t hostReads = 0;
  std::uint64_t hostWrites = 0;
  std::uint64_t numFreeVirtualBlocks = 0;
  std::uint64_t wearLevMoves = 0;
  std::uint64_t nandReads = 0;
  std::uint64_t nandWrites = 0;
  std::uint64_t bandErases = 0;
  std::uint64_t indPoolFree = 0;
  std::uint64_t indPoolCount = 0;
  std::uint64_t utilFormatTime = 0;  // seconds since 1970
  std::uint64_t numSleepOps = 0;
  std::uint64_t maxHighEnduranceBlockErases = 0;
  std::array<std::uint64_t, 5> readCountHisto{};

  // The driver exports what it knows alone: a field above of which the buffer has no counter is not
  // known, and is not reported.
  bool exportsKnownAlone = false;

  // Every counter of the buffer, in its order.
  SPXCounterBlock* firstBlock = nullptr;
  SPXCounterBlock* lastBlock = nullptr;
};

// Calls visit(name, value) for every counter, in the order of the buffer.
template <class Visit>
void SPXForEachCounter(const SPXParseContext& context, const Visit& visit) {
  for (const SPXCounterBlock* block = context.firstBlock; block != nullptr; block = block->next) {
    for (std::uint32_t i = 0; i < block->count; ++i) {
      visit(SPXCounterName(block->names()[i]), block->values()[i]);
    }
  }
}

// Parses a statistics buffer: little-endian records of a 32-bit key, a 32-bit count and that many
// 64-bit values, without gaps. Counters are appended to those that are there,
// the other fields overwritten.
// Returns 1, or 0 when the buffer has no record, a key is out of range, a record runs past the
// end, or memory runs out; exportVersion is then 0 (a buffer of less than 8 bytes leaves it alone)
// and the counters before the fault stay.
TALLY_API int SPXParseBufferToCxt(SPXParseContext* context, const void* buffer, std::size_t length);

// Frees the counters and empties the whole context.
TALLY_API void SPXReleaseContext(SPXParseContext* context);

// A counter's name, and the key it is reported under.
struct SPXKeyMapRow {
  std::string_view name;
  std::string_view key;
};

// The rows; an end row with an empty name follows the last. If a name occurs twice, the first row
// applies.
TALLY_API extern const std::span<const SPXKeyMapRow> keyMap;

}  // namespace tally
