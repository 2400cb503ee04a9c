// The interest list: which channels of which drivers a subscription is for.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "base/large_memory.h"
#include "kv/value.h"

namespace tally {

// Filled in one walk over the desired channels.
class InterestList {
 public:
  // -1 for a malformed collection, else the number of channels.
  std::int32_t fill(KvDictionary* desired);
  // True when every channel has a driver id, a channel id and a type word, and they are not too
  // many.
  bool complete() const noexcept { return complete_; }
  // The list as the hub expects it, in walk order.
  std::span<const std::byte> bytes() const noexcept { return std::as_bytes(std::span(words_)); }

 private:
  // Little-endian 64-bit words: the count with 32 reserved bits, and three for each channel.
  std::vector<std::uint64_t, LargeAllocator<std::uint64_t>> words_;
  bool complete_ = true;
};

}  // namespace tally
