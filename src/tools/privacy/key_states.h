// What was seen of each key while the store was read.
#pragma once

#include <algorithm>
#include <bit>
#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

#include "base/hash.h"
#include "tools/privacy/exposure.h"

namespace tally::tools {

// Counts different values, each in 64 bits.
class Distinct {
 public:
  void add(std::uint64_t value) {
    if (more_ || std::ranges::find(seen_, value) != seen_.end()) return;
    if (seen_.size() < DistinctCount::kMost) {
      seen_.push_back(value);
    } else {
      more_ = true;
    }
  }
  bool isFull() const { return more_; }
  DistinctCount count() const { return {static_cast<std::uint32_t>(seen_.size()), more_}; }

 private:
  std::vector<std::uint64_t> seen_;
  bool more_ = false;
};

struct KeyState {
  KeyExposure exposure;
  const ScalarOptions* options = nullptr;  // null: the key is not reported
  Distinct values, reported;
};

// Keys of one kind, found quickly when they come in the same order day after day.
class KeyStates {
 public:
  // The state of the key; make(key) makes it when it is new. Valid until the next call.
  template <class Make>
  KeyState& at(std::string_view key, const Make& make) {
    if (next_ < states_.size() && states_[next_].exposure.key == key) return states_[next_++];
    const std::uint32_t hash = hashBytes(key);
    std::uint32_t found =
        index_.findOrAdd(hash, static_cast<std::uint32_t>(states_.size()),
                         [&](std::uint32_t number) { return states_[number].exposure.key == key; });
    if (found == HashIndex::kNone) {
      found = static_cast<std::uint32_t>(states_.size());
      states_.push_back(make(key));
    }
    next_ = found + 1;
    return states_[found];
  }
  std::vector<KeyState>& all() { return states_; }

 private:
  std::vector<KeyState> states_;
  HashIndex index_;
  std::size_t next_ = 0;
};

}  // namespace tally::tools
