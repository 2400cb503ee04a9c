#include "hwreport/rows/run_block.h"

#include <algorithm>
#include <new>

#include "base/large_memory.h"

namespace tally {
namespace {

// From here on the last large page may be mostly unused.
constexpr std::size_t kLargeBlock = 4 * kLargePage;

bool sameIDs(const std::byte* a, const std::byte* b) { return std::memcmp(a, b, kElementIDs) == 0; }

}  // namespace

BlockMemory::BlockMemory(std::size_t size)
    : start_(static_cast<std::byte*>(size >= kLargeBlock ? allocateLarge(size)
                                                         : ::operator new(size))),
      size_(size) {}

BlockMemory::~BlockMemory() {
  if (size_ >= kLargeBlock) {
    freeLarge(start_, size_);
  } else {
    ::operator delete(start_);
  }
}

RunBlock::RunBlock(std::size_t rows, std::size_t sizeOfRuns, BlockMemory memory)
    : memory_(std::move(memory)), rows_(rows), used_(placesSize(rows)) {
  const std::size_t size = used_ + sizeOfRuns;
  if (memory_.size() < size) memory_ = BlockMemory(size);
  std::memset(memory_.start(), 0, used_);
}

ElementRun RunBlock::runAt(std::size_t place) const noexcept {
  const Header header = headerAt(place);
  const std::byte* const start = memory_.start() + place * kUnit + kHeader;
  return header.packed != 0 ? ElementRun::packed(start, header.elements)
                            : ElementRun({start, header.elements * element::kSize});
}

void RunBlock::prefetch(std::size_t row) const noexcept {
  if (row >= rows_) return;
  const std::byte* const start = memory_.start() + placeOf(row) * kUnit;
  __builtin_prefetch(start);
  __builtin_prefetch(start + 64);
}

void RunBlock::makeSpace(std::size_t size) {
  if (size <= memory_.size() - used_) return;
  BlockMemory larger(std::max(memory_.size() + memory_.size() / 2, used_ + size));
  std::memcpy(larger.start(), memory_.start(), used_);
  memory_ = std::move(larger);
}

std::byte* RunBlock::begin(std::size_t row, std::size_t elements, bool packed) {
  const Header header = {static_cast<std::uint32_t>(row),
                         static_cast<std::uint32_t>(elements) & INT32_MAX, packed ? 1u : 0u};
  const std::size_t size = sizeAt(header);
  const std::size_t place = used_ / kUnit;
  if (elements > INT32_MAX || place > UINT32_MAX) throw std::bad_alloc();
  makeSpace(size);
  setPlace(row, static_cast<std::uint32_t>(place));
  std::byte* const start = memory_.start() + used_;
  std::memcpy(start, &header, sizeof(header));
  used_ += size;
  return start + kHeader;
}

void RunBlock::add(std::size_t row, std::span<const std::byte> elements) {
  const std::size_t former = used_;
  const ElementRun run(elements);
  std::byte* const start = begin(row, run.elements(), true);
  std::memcpy(start, elements.data(), kElementIDs);
  std::byte* to = start + kElementIDs;
  for (std::size_t i = 0; i < run.elements(); ++i, to += kElementRest) {
    if (!sameIDs(run.ids(i), start)) {
      used_ = former;
      std::memcpy(begin(row, run.elements(), false), elements.data(), elements.size());
      return;
    }
    std::memcpy(to, run.rest(i), kElementRest);
  }
}

WritableRun RunBlock::addCopy(std::size_t row, const ElementRun& run, std::size_t elements) {
  // Elements side by side may have different ids.
  const bool packed = run.isPacked();
  std::byte* const start = begin(row, elements, packed);
  const std::size_t size =
      packed ? kElementIDs + elements * kElementRest : elements * element::kSize;
  std::memcpy(start, run.ids(0), size);
  return {start + kElementIDs, packed ? kElementRest : element::kSize};
}

}  // namespace tally
