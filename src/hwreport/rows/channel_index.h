// Finds the row of a channel by driver and id.
#pragma once

#include <cstdint>
#include <vector>

namespace tally {

class ChannelRows;

// What the legends of all rows said when it was made. The channels have positions: at first those
// of their rows, later those of their runs in a sample, since a hub mostly keeps the order, and the
// channel of a run is then the one after that of the run before.
class ChannelIndex {
 public:
  explicit ChannelIndex(const ChannelRows& rows);
  // Puts the channels into another order: some of the rows, each once. The others follow. REQUIRES:
  // they are in the order of the rows.
  void reorder(std::vector<std::uint32_t> order);
  static constexpr std::uint32_t kNone = UINT32_MAX;

  bool isInOrderOfRows() const noexcept { return inOrderOfRows_; }
  std::size_t size() const noexcept { return channels_.size(); }
  // True if the channel is there, and no earlier row has it; false past the end.
  bool isAt(std::size_t position, std::uint64_t driverID, std::uint64_t channelID) const noexcept {
    return position < size() && channels_[position].id == channelID &&
           drivers_[channels_[position].shape] == driverID && channels_[position].repeated == 0;
  }
  std::uint32_t row(std::size_t position) const noexcept { return channels_[position].row; }
  // The invalid marker where it cannot be read.
  std::uint64_t typeBits(std::size_t position) const noexcept {
    return channels_[position].typeBits;
  }

  // Three steps of a look-up, so that many of them can wait for memory side by side. It finds the
  // position of the channel's first row, or kNone.
  std::size_t slotOf(std::uint64_t driverID, std::uint64_t channelID) const noexcept;
  void prefetchSlot(std::size_t slot) const noexcept { __builtin_prefetch(&slots_[slot]); }
  void prefetchChannel(std::size_t slot) const noexcept;
  std::uint32_t find(std::size_t slot, std::uint64_t driverID,
                     std::uint64_t channelID) const noexcept;

  // Every channel has a driver, an id and a type word.
  bool isComplete() const noexcept { return complete_; }
  // Rows whose channel has no format yet; they ascend.
  const std::vector<std::uint32_t>& formless() const noexcept { return formless_; }
  // Rows of channels that an earlier row has too.
  struct Repeated {
    std::uint32_t row, first;
    bool sameType;
  };
  const std::vector<Repeated>& repeated() const noexcept { return repeated_; }
  // The size of all runs in a block, if they are as long as the type words say.
  std::size_t sizeOfRuns() const noexcept { return sizeOfRuns_; }
  // False once a legend may say something else.
  bool isCurrent() const noexcept;

 private:
  struct Channel {
    std::uint64_t id, typeBits;
    std::uint32_t row;
    std::uint32_t shape : 31;
    std::uint32_t repeated : 1;  // an earlier row has it too, and is the one that is found
  };
  void read(const ChannelRows& rows, std::uint32_t row);
  void place(std::uint32_t position);

  bool inOrderOfRows_ = true;
  std::size_t changes_;                 // of arrays, before any was read
  std::vector<std::uint64_t> drivers_;  // by shape
  std::vector<Channel> channels_;
  std::vector<std::uint32_t> slots_;  // positions; open addressing, at most three quarters full
  std::vector<std::uint32_t> formless_;
  std::vector<Repeated> repeated_;
  std::size_t sizeOfRuns_ = 0;
  bool complete_ = true;
};

}  // namespace tally
