// Cuts the runs of a frame's channels out of a buffer of raw elements.
#pragma once

#include <array>
#include <cstdint>
#include <span>

#include "hwreport/rows/channel_frame.h"

namespace tally {

// Finds what a scan from the buffer's start would find for each channel, in one pass for all.
//
// That scan steps from run to run and takes the first one of the channel. It stops at a run of no
// elements, and it ends at a run that is longer than what is left of the buffer. Bytes after the
// last whole element are ignored.
class FrameSampler {
 public:
  // What became of the channels that the scan did not find.
  enum class Result { Complete, SomeMissing, Stopped };
  // Fills the frame, which has all rows of its channels and no elements.
  static Result sample(ChannelFrame& frame, std::span<const std::byte> buffer);

 private:
  FrameSampler(ChannelFrame& frame, std::span<const std::byte> buffer);
  // True when the scan meets a run of no elements.
  bool scan();
  void note(std::size_t offset, std::size_t size);
  void add();
  void learnOrder();
  Result finish(bool stopped);

  struct Noted {
    std::size_t offset, size;
    std::uint64_t driverID, channelID;
    std::uint32_t position;  // of the channel, or where a slot has to be looked at
    std::size_t slot;
  };
  ChannelFrame& frame_;
  std::shared_ptr<const ChannelIndex> index_;
  const std::span<const std::byte> buffer_;
  // Runs wait here, in their order, while the memory of their look-up is fetched.
  static constexpr std::size_t kWaiting = 32, kChannelAhead = 16;
  std::array<Noted, kWaiting> noted_{};
  std::size_t notedCount_ = 0;
  std::size_t added_ = 0;
  std::size_t expected_ = 0;  // the position of the next run, if the order is the known one
  std::size_t searched_ = 0;  // runs for which it was not
};

}  // namespace tally
