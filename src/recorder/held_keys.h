// The keys of one day in memory, and what was recorded of each since the last commit.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/hash.h"
#include "platform/recording/recording_store.h"
#include "recorder/sample_stream.h"

namespace tally {

// What was recorded of a scalar: a value, if one was set, and an amount that adds to it or to what
// the store has.
class HeldScalar {
 public:
  // A counter's amount. Fractions add up.
  void add(double amount);
  void set(double value);
  // A gauge's change.
  void move(double amount);

  struct Change {
    RecordedChange::Kind kind;
    std::int64_t value;
    bool clamped;
  };
  // What is to be committed; empty if nothing is. With atEnd a remaining fraction is rounded, else
  // it is kept for the next time.
  std::optional<Change> take(bool atEnd);

 private:
  double value_ = 0;  // as it was set; kept, since later changes build on it
  double amount_ = 0, fraction_ = 0;
  std::int64_t whole_ = 0;
  bool isSet_ = false, dirty_ = false, moves_ = false, clamped_ = false;
};

enum class HeldType : std::uint8_t { None, Counter, Gauge, Distribution };

struct HeldKey {
  std::string_view key;  // lives as long as the HeldKeys
  HeldScalar scalar;
  std::unique_ptr<SampleStream> samples;  // null while there are none
  float weightLeft = 0;                   // of rates whose weights are not whole
  std::uint32_t user = 0;                 // index of the owner
  HeldType type = HeldType::None;
  bool dirty = false, isNew = false, durable = false, twoTypes = false;
};

class HeldKeys {
 public:
  // Without a day, the clock is not set: offsets then count from `origin`, in seconds since boot.
  HeldKeys(std::optional<std::int32_t> day, std::int64_t origin) : day_(day), origin_(origin) {}

  std::optional<std::int32_t> day() const { return day_; }
  std::int64_t origin() const { return origin_; }
  std::size_t size() const { return keys_.size(); }
  HeldKey& at(std::uint32_t index) { return keys_[index]; }

  static constexpr std::uint32_t kNone = HashIndex::kNone;
  // By what identifies the metric, or by its key.
  std::uint32_t find(std::string_view identity) const { return findIn(identities_, identity); }
  std::uint32_t findKey(std::string_view key) const;
  // Adds a key; returns its index and, in bytes, by how much memory grew. REQUIRES: neither is
  // there.
  std::uint32_t add(std::string_view identity, std::string_view key, std::size_t& bytes);
  // Has a further identity lead to the key.
  void addIdentity(std::string_view identity, std::uint32_t index, std::size_t& bytes);

  void markDirty(std::uint32_t index) {
    if (keys_[index].dirty) return;
    keys_[index].dirty = true;
    dirty_.push_back(index);
  }
  // Those marked since the last call.
  std::vector<std::uint32_t> takeDirty() { return std::exchange(dirty_, {}); }
  const std::vector<std::uint32_t>& dirty() const { return dirty_; }

 private:
  // Identities that are not the key itself are entries of their own.
  struct Identity {
    std::string_view text;
    std::uint32_t index;
  };
  std::uint32_t findIn(const HashIndex& index, std::string_view text) const;
  std::string_view keep(std::string_view text);

  std::optional<std::int32_t> day_;
  std::int64_t origin_;
  std::vector<HeldKey> keys_;
  std::vector<Identity> texts_;
  HashIndex identities_, others_;  // entries of texts_; others_: keys that are not an identity
  std::vector<std::uint32_t> dirty_;
  std::deque<std::string> blocks_;  // of the texts
};

}  // namespace tally
