// What one commit writes.
#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/recording/recording_store.h"
#include "recorder/held_keys.h"
#include "recorder/refusal.h"

namespace tally {

// The changes of some keys of one day, or of the time before the clock was set.
struct CommitBatch {
  struct Change {
    std::string_view key;
    RecordedChange::Kind kind = RecordedChange::Kind::Add;
    std::int64_t value = 0;
    std::unique_ptr<SampleStream> samples;
    std::uint32_t user = 0;  // index
    std::int64_t userNumber = 0;
    std::uint32_t index = 0;  // of the key
  };
  std::shared_ptr<HeldKeys> keys;  // whose texts the changes borrow
  std::optional<std::int32_t> day;
  std::int64_t origin = 0;              // seconds since boot from which offsets count without a day
  std::optional<double> originOnClock;  // the same in seconds since 1970, once that is known
  std::vector<Change> changes;
  std::vector<KeyOwner> owners;  // of keys that are new
  // What was refused and counted since the batch before.
  RefusalCounts refused{};
  RecorderCounts counts{};

  bool empty() const {
    const auto isZero = [](std::uint64_t count) { return count == 0; };
    return changes.empty() && std::ranges::all_of(refused, isZero) &&
           std::ranges::all_of(counts, isZero);
  }
};

struct CommitJob {
  std::vector<CommitBatch> batches;
  // Once the clock is set, undated changes of this boot are dated by this, and old ones forgotten.
  std::optional<double> wallMinusBoot;
  std::int32_t today = 0;  // with a set clock; nothing is dated later
  // The time that the recorder ran and that was not committed yet, in nanoseconds since boot.
  struct Running {
    std::int64_t from = 0, until = 0;
    double wallMinusBoot = 0;
  };
  std::optional<Running> ran;  // with a set clock
};

}  // namespace tally
