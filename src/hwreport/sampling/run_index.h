// Finding the runs of channels in a buffer of raw elements.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "base/large_memory.h"

namespace tally {

// Gives the answers of a scan from the buffer's start for each channel, for the price of one scan.
//
// That scan steps from run to run and takes the first one of the channel. It stops at a run of no
// elements, and it ends at a run that is longer than what is left of the buffer.
class RunIndex {
 public:
  // Bytes after the last whole element are not looked at. The buffer is borrowed.
  explicit RunIndex(std::span<const std::byte> buffer);
  // Empty when the scan would end without finding the channel. Ask stopped() what ended it.
  std::optional<std::span<const std::byte>> find(std::uint64_t driverID,
                                                 std::uint64_t channelID) const;
  // Has the channel's run fetched into the cache for a find() to come, 2 kFetching calls later:
  // first its slot, and the run when the slot has come.
  void fetch(std::uint64_t driverID, std::uint64_t channelID);
  static constexpr std::size_t kFetching = 8;
  // True when the scan meets a run of no elements.
  bool stopped() const noexcept { return stopped_; }

 private:
  // Elements are counted from 1; 0 is a free slot. The hash stands beside, so that another run of
  // the buffer is hardly ever looked at.
  struct Slot {
    std::uint32_t element = 0;
    std::uint32_t hash = 0;
  };
  // The slot of the channel's run, or the free one where it belongs.
  std::size_t slotOf(std::uint64_t driverID, std::uint64_t channelID, std::uint32_t hash) const;
  // Runs are added in batches, in their order, so that their slots are fetched meanwhile.
  void note(std::size_t offset);
  void addNoted();
  void grow();

  std::span<const std::byte> buffer_;
  bool stopped_ = false;
  using Slots = std::vector<Slot, LargeAllocator<Slot>>;
  Slots slots_;  // at most half full; a power of two
  std::size_t runs_ = 0;
  std::array<Slot, 16> noted_{};
  std::size_t notedCount_ = 0;
  std::array<std::uint32_t, kFetching> fetching_{};  // hashes whose slots are on their way
  std::size_t fetched_ = 0;
};

}  // namespace tally
