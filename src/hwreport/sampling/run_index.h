// Finds the runs of channels in a buffer of raw elements.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>

#include "base/hash.h"

namespace tally {

// Finds what a scan from the buffer's start would find for each channel, in the time of one scan.
//
// That scan steps from run to run and takes the first one of the channel. It stops at a run of no
// elements, and it ends at a run that is longer than what is left of the buffer.
class RunIndex {
 public:
  // Bytes after the last whole element are ignored. The buffer is borrowed.
  explicit RunIndex(std::span<const std::byte> buffer);
  // Empty when the scan would end without finding the channel. Ask stopped() what ended it.
  std::optional<std::span<const std::byte>> find(std::uint64_t driverID,
                                                 std::uint64_t channelID) const;
  // Prefetches the channel's run for a find() that follows 2 kFetching calls later: first its slot,
  // then the run.
  void fetch(std::uint64_t driverID, std::uint64_t channelID);
  static constexpr std::size_t kFetching = 8;
  // True when the scan meets a run of no elements.
  bool stopped() const noexcept { return stopped_; }

 private:
  // A run, by the number of its first element.
  struct Run {
    std::uint32_t element = 0;
    std::uint32_t hash = 0;
  };
  bool isRunOf(std::uint32_t run, std::uint64_t driverID, std::uint64_t channelID) const;
  // Runs are added in batches, in their order, so that their slots are fetched meanwhile.
  void note(std::size_t offset);
  void addNoted();

  std::span<const std::byte> buffer_;
  bool stopped_ = false;
  HashIndex index_;
  std::array<Run, 16> noted_{};
  std::size_t notedCount_ = 0;
  std::array<std::uint32_t, kFetching> fetching_{};  // hashes whose slots are being fetched
  std::size_t fetched_ = 0;
};

}  // namespace tally
