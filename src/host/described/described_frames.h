// Raw elements of statistics channels as a description gives them.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "kv/value.h"

namespace tally {

// A raw element: who it belongs to, when it was updated, and four values.
constexpr std::size_t kElementSize = 64;
struct ElementLayout {
  static constexpr std::size_t driver = 0, channel = 8, type = 16, time = 24, values = 32;
};
constexpr std::uint64_t kMissingValue = 0x8000000000000000;

struct ElementValues {
  std::uint64_t time = 0;
  std::uint64_t slots[4] = {kMissingValue, kMissingValue, kMissingValue, kMissingValue};
};

// The elements of one channel, one frame for each refresh. What a shorter frame lacks are missing
// values; they are not held, since a long frame among many short ones would cost the product.
struct ChannelFrames {
  std::uint64_t type = 0;  // the type word; 0 when only the legend gives it
  std::vector<std::vector<ElementValues>> frames;
  std::size_t elementCount = 0;  // of the longest frame
};

// description is one entry of "HwReportValues": "Type" (integer, optional) and either "Value", one
// frame, or "Frames", an array of them. A frame is a number (a simple value), an array of numbers
// (a simple array), or an array of dictionaries (an element each: "ID", "InTransitions",
// "Residency" of a state; "Hits", "Minimum", "Maximum", "Sum" of a bucket; "Time" of either).
// Empty when malformed.
std::optional<ChannelFrames> parseChannelFrames(const KvDictionary& description);

}  // namespace tally
