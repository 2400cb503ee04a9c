// Raw elements of statistics channels as a description gives them.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "kv/value.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

// When an element was updated, and its values.
struct ElementValues {
  std::uint64_t time = 0;
  std::uint64_t slots[element::kSlotCount] = {element::kMissingValue, element::kMissingValue,
                                              element::kMissingValue, element::kMissingValue};
};

// The elements of one channel, one frame for each refresh. The elements that a shorter frame lacks
// are missing values; they are not stored, since one long frame among many short ones would make
// all of them long.
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
