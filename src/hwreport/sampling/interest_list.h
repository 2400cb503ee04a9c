// The interest list: which channels of which drivers a subscription is for.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "base/large_memory.h"
#include "hwreport/rows/channel_frame.h"

namespace tally {

class InterestList {
 public:
  // The channels of one level. Levels are added in walk order.
  void add(const ChannelFrame& channels);
  std::size_t count() const noexcept { return count_; }
  // True when every channel has a driver id, a channel id and a type word, and they are not too
  // many.
  bool complete() const noexcept { return complete_ && count_ <= kMostInterests; }
  // The list as the hub expects it, in walk order.
  std::span<const std::byte> bytes() const noexcept { return std::as_bytes(std::span(words_)); }

 private:
  std::size_t count_ = 0;
  // Little-endian 64-bit words: the count with 32 reserved bits, and three for each channel.
  std::vector<std::uint64_t, LargeAllocator<std::uint64_t>> words_{0};
  bool complete_ = true;
};

}  // namespace tally
