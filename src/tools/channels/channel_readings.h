// The values of a sampled statistics channel, read once for every form of output.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "kv/value.h"

namespace tally::tools {

// A missing value is empty.
struct StateReading {
  std::string name;  // else its id in hexadecimal
  std::uint64_t id = 0;
  std::optional<std::uint64_t> entries;    // how often it was entered
  std::optional<std::uint64_t> residency;  // in the channel's unit
  double share = 0;  // of all residencies; NaN when one is missing or all are 0
  bool isCurrent = false;
};
struct BucketReading {
  std::optional<std::int64_t> lower, upper;  // of the channel's configuration
  std::optional<std::uint64_t> hits;
  std::optional<std::int64_t> minimum, maximum, sum;
};

std::optional<std::int64_t> readSimple(const KvDictionary& channel);
std::vector<StateReading> readStates(KvDictionary& channel);
std::vector<BucketReading> readBuckets(KvDictionary& channel);
// The values of an array up to the last one that is present.
std::vector<std::optional<std::int64_t>> readArray(const KvDictionary& channel);

// The channel's name, else its id in hexadecimal.
std::string channelName(KvDictionary& channel);
// What the channel's source says of it beyond what the library reads (kLegendDetails); null if it
// says nothing.
const KvDictionary* channelDetails(const KvDictionary& channel);
// Text that may be missing; empty then.
std::string textOf(const KvString* text);
// "simple", "state", "histogram", "array"; "unknown" for every other format.
std::string_view formatName(std::uint8_t format);

}  // namespace tally::tools
