// Finds the row of a channel by driver and id.
#pragma once

#include <cstdint>
#include <vector>

namespace tally {

class ChannelRows;
class RunBlock;

// What the legends of all rows said when it was made.
class ChannelIndex {
 public:
  explicit ChannelIndex(const ChannelRows& rows);
  static constexpr std::uint32_t kNone = UINT32_MAX;

  // Three steps of a look-up, so that many of them can wait for memory side by side.
  std::size_t slotOf(std::uint64_t driverID, std::uint64_t channelID) const noexcept;
  void prefetchSlot(std::size_t slot) const noexcept { __builtin_prefetch(&slots_[slot]); }
  // And the row's place in a block.
  void prefetchRow(std::size_t slot, const RunBlock& block) const noexcept;
  // The first row of that channel, searched from its slot on.
  std::uint32_t find(std::size_t slot, std::uint64_t driverID,
                     std::uint64_t channelID) const noexcept;

  // The invalid marker where they cannot be read.
  std::uint64_t driverID(std::size_t row) const noexcept { return drivers_[shapeOf(row)]; }
  std::uint64_t channelID(std::size_t row) const noexcept { return channels_[row].id; }
  std::uint64_t typeBits(std::size_t row) const noexcept { return channels_[row].typeBits; }

  // Every channel has an id and a type word.
  bool complete() const noexcept { return complete_; }
  void prefetchType(std::size_t row) const noexcept { __builtin_prefetch(&channels_[row]); }
  // Rows whose channel has no format yet.
  const std::vector<std::uint32_t>& formless() const noexcept { return formless_; }
  // Rows of channels that an earlier row has too.
  struct Repeated {
    std::uint32_t row, first;
  };
  const std::vector<Repeated>& repeated() const noexcept { return repeated_; }
  // The size of all runs in a block, if they are as long as the type words say.
  std::size_t sizeOfRuns() const noexcept { return sizeOfRuns_; }
  bool isCurrent() const noexcept;

 private:
  struct Channel {
    std::uint64_t id, typeBits;
  };
  std::uint32_t shapeOf(std::size_t row) const noexcept;
  void addRow(std::uint32_t row);

  const ChannelRows& rows_;
  const std::size_t changes_;           // of arrays, before any was read
  std::vector<std::uint64_t> drivers_;  // by shape
  std::vector<Channel> channels_;       // by row
  std::vector<std::uint32_t> slots_;    // rows; open addressing, at most three quarters full
  std::vector<std::uint32_t> formless_;
  std::vector<Repeated> repeated_;
  std::size_t sizeOfRuns_ = 0;
  bool complete_ = true;
};

}  // namespace tally
