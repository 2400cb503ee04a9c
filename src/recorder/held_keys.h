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

// An amount of a scalar: whole numbers are exact to 64 bits.
struct ScalarAmount {
  std::int64_t whole = 0;
  double fraction = 0;  // between -1 and 1
  bool clamped = false;

  static ScalarAmount of(double number);
};

// What was recorded of a scalar: a value, if one was set, or an amount that adds to what the store
// has. Fractions add up.
class HeldScalar {
 public:
  void add(const ScalarAmount& amount);
  void set(const ScalarAmount& value);
  // A gauge's change.
  void move(const ScalarAmount& amount);

  struct Change {
    RecordedChange::Kind kind;
    std::int64_t value;
    bool clamped;
  };
  // What is to be committed; empty if nothing is. With atEnd a remaining fraction is rounded, else
  // it is kept for the next time.
  std::optional<Change> take(bool atEnd);
  // Takes a change back that could not be committed.
  void putBack(const Change& change);

 private:
  // As it was set, and what was added since; without that, what was added since the last commit.
  std::int64_t whole_ = 0;
  double fraction_ = 0;
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
  bool revoked = false;  // the owner may not record it any longer
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
  // Adds a key; returns its index. REQUIRES: neither is there.
  std::uint32_t add(std::string_view identity, std::string_view key);
  // Has a further identity lead to the key.
  void addIdentity(std::string_view identity, std::uint32_t index);
  // Adds a key to which no identity leads.
  std::uint32_t addKey(std::string_view key);
  // From now on identities are made by other rules.
  void forgetIdentities();
  // Of memory, without samples.
  std::size_t bytes() const { return bytes_; }

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
  void addText(std::string_view kept, std::uint32_t index);
  std::uint32_t addHeld(std::string_view key);

  std::optional<std::int32_t> day_;
  std::int64_t origin_;
  std::vector<HeldKey> keys_;
  std::vector<Identity> texts_;
  HashIndex identities_, others_;  // entries of texts_; others_: keys that are not an identity
  std::vector<std::uint32_t> dirty_;
  std::deque<std::string> blocks_;  // of the texts
  std::size_t bytes_ = 0;
};

}  // namespace tally
