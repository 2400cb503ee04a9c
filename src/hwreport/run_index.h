// Finding the runs of channels in a buffer of raw elements.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <vector>

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
  // True when the scan meets a run of no elements.
  bool stopped() const noexcept { return stopped_; }

 private:
  struct Run {
    std::uint64_t driverID = 0;
    std::uint64_t channelID = 0;
    std::size_t offset = 0;
    std::size_t size = 0;
  };
  // The slot that holds the channel's run, or the free one where it belongs.
  std::size_t slotOf(std::uint64_t driverID, std::uint64_t channelID) const;

  std::span<const std::byte> buffer_;
  bool stopped_ = false;
  std::vector<Run> runs_;
  std::vector<std::uint32_t> slots_;  // run number plus 1; 0 is free
};

}  // namespace tally
