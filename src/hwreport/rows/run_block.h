// The runs of elements of one sample, in one block of memory.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <utility>

#include "hwreport/channels/raw_element.h"

namespace tally {

// Memory of a block, which the next sample can take over.
class BlockMemory {
 public:
  BlockMemory() = default;
  explicit BlockMemory(std::size_t size);
  BlockMemory(BlockMemory&& other) noexcept
      : start_(std::exchange(other.start_, nullptr)), size_(std::exchange(other.size_, 0)) {}
  BlockMemory& operator=(BlockMemory&& other) noexcept {
    std::swap(start_, other.start_);
    std::swap(size_, other.size_);
    return *this;
  }
  ~BlockMemory();
  std::byte* start() const noexcept { return start_; }
  std::size_t size() const noexcept { return size_; }

 private:
  std::byte* start_ = nullptr;
  std::size_t size_ = 0;
};

// Elements whose slots are being written.
struct WritableRun {
  std::byte* rest = nullptr;  // of the first element
  std::size_t stride = 0;
  void setSlot(std::size_t index, std::size_t number, std::uint64_t value) const {
    std::memcpy(rest + index * stride + number * 8 + element::kSlots - kElementIDs, &value,
                sizeof(value));
  }
};

// Where each row's run begins, followed by the runs in the order in which they were added. A run is
// stored packed if its elements have the same ids, which saves a third, and otherwise as it is.
class RunBlock {
 public:
  RunBlock() = default;
  // For so many rows. The memory may be one that is reused; it grows as needed.
  RunBlock(std::size_t rows, std::size_t sizeOfRuns, BlockMemory memory);
  static constexpr std::size_t sizeOf(std::size_t elements) {
    return kHeader + kElementIDs + elements * kElementRest;
  }
  std::size_t rows() const noexcept { return rows_; }
  std::size_t sizeOfRuns() const noexcept { return used_ - std::min(used_, placesSize(rows_)); }

  bool has(std::size_t row) const noexcept { return row < rows_ && placeOf(row) != kNowhere; }
  // REQUIRES: the row has one.
  ElementRun run(std::size_t row) const noexcept { return runAt(placeOf(row)); }
  void prefetch(std::size_t row) const noexcept;

  // REQUIRES: the elements are whole, and at least one.
  void add(std::size_t row, std::span<const std::byte> elements);
  // The first elements of a run, to be written to until the next one is added.
  WritableRun addCopy(std::size_t row, const ElementRun& run, std::size_t elements);
  // The row gets the run of another one.
  void share(std::size_t row, std::size_t other) noexcept { setPlace(row, placeOf(other)); }

  // The runs in their order: step(row, run) for each until it gives false. Some steps before,
  // ahead(row) can have memory fetched.
  template <class Ahead, class Step>
  bool eachInOrder(Ahead ahead, Step step) const {
    constexpr std::size_t kAhead = 16;
    struct {
      std::size_t row, place;
    } noted[kAhead];
    std::size_t notedCount = 0, done = 0;
    const auto next = [&] {
      const auto& one = noted[done++ % kAhead];
      return step(one.row, runAt(one.place));
    };
    for (std::size_t place = firstPlace(); place * kUnit < used_;) {
      if (notedCount - done == kAhead && !next()) return false;
      const Header header = headerAt(place);
      noted[notedCount++ % kAhead] = {header.row, place};
      ahead(header.row);
      place += sizeAt(header) / kUnit;
    }
    while (done < notedCount) {
      if (!next()) return false;
    }
    return true;
  }
  void prefetchPlace(std::size_t row) const noexcept {
    __builtin_prefetch(memory_.start() + row * sizeof(std::uint32_t));
  }
  BlockMemory takeMemory() noexcept {
    rows_ = used_ = 0;
    return std::move(memory_);
  }

 private:
  struct Header {
    std::uint32_t row = 0;
    std::uint32_t elements : 31 = 0;
    std::uint32_t packed : 1 = 0;
  };
  static constexpr std::size_t kUnit = 8, kHeader = 8;
  static_assert(sizeof(Header) == kHeader && kElementIDs % kUnit == 0 && kElementRest % kUnit == 0);
  static constexpr std::uint32_t kNowhere = 0;  // there are the places

  std::size_t firstPlace() const noexcept { return placesSize(rows_) / kUnit; }
  static constexpr std::size_t placesSize(std::size_t rows) {
    return (rows + 2) / 2 * 2 * sizeof(std::uint32_t);  // at least one unit, and whole ones
  }
  static std::size_t sizeAt(const Header& header) {
    return header.packed != 0 ? sizeOf(header.elements)
                              : kHeader + std::size_t{header.elements} * element::kSize;
  }
  std::uint32_t placeOf(std::size_t row) const noexcept {
    std::uint32_t place;
    std::memcpy(&place, memory_.start() + row * sizeof(place), sizeof(place));
    return place;
  }
  void setPlace(std::size_t row, std::uint32_t place) noexcept {
    std::memcpy(memory_.start() + row * sizeof(place), &place, sizeof(place));
  }
  Header headerAt(std::size_t place) const noexcept {
    Header header;
    std::memcpy(&header, memory_.start() + place * kUnit, sizeof(header));
    return header;
  }
  ElementRun runAt(std::size_t place) const noexcept;
  void makeSpace(std::size_t size);
  std::byte* begin(std::size_t row, std::size_t elements, bool packed);

  BlockMemory memory_;
  std::size_t rows_ = 0;
  std::size_t used_ = 0;
};

}  // namespace tally
