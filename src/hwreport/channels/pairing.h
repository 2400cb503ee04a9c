// Finds the earlier counterpart of a later channel.
#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "base/hash.h"
#include "hwreport/channels/type_word.h"
#include "kv/value.h"

namespace tally {

// The channels of an earlier sample, asked for by the later ones in ascending order of index.
//
// The counterpart is the earlier channel at the same index when driver, channel id and type word
// are equal. Otherwise, if at least the driver is equal, it is the next one from a cursor on with
// the same channel id and type word; the cursor starts after the index and moves past what was
// found. An earlier entry on the way that is not a readable channel is a failure.
class EarlierChannels {
 public:
  explicit EarlierChannels(const KvArray& channels) : channels_(channels) {}
  // Null: there is no counterpart. Empty: failure.
  std::optional<KvDictionary*> counterpartOf(const KvDictionary& later, std::size_t index);

 private:
  struct Key {
    std::uint64_t channelID = 0;
    std::uint64_t typeBits = 0;
    bool operator==(const Key&) const = default;
  };
  std::optional<KvDictionary*> search(const Key& key, std::size_t from);
  void buildIndex();
  static std::uint32_t hashOf(const Key& key);
  // The first channel with a key, by position; HashIndex::kNone when there is none.
  std::uint32_t firstOf(const Key& key) const;

  const KvArray& channels_;
  std::optional<std::size_t> cursor_;
  // The index, made at the first search. No search starts before the previous one.
  bool indexed_ = false;
  HashIndex firsts_;                     // the first position of each key
  std::vector<Key> keys_;                // by position
  std::vector<std::uint32_t> next_;      // by position: the next one with the same key
  std::vector<std::uint32_t> ahead_;     // by first position: the first one not yet passed
  std::vector<std::size_t> unreadable_;  // descending
};

}  // namespace tally
