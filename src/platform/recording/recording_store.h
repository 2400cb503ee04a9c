// What the recorder writes to the metrics store.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "platform/tables/own_metrics.h"

namespace tally {

// Samples of one key in the order of their arrival. The columns have one length, but for the
// weights, which may be empty: each sample then counts once.
struct SampleColumns {
  std::span<const double> values;
  std::span<const std::uint32_t> offsets;  // seconds into the day; of undated ones, see UndatedRows
  std::span<const std::uint32_t> weights;  // how many samples each one stands for, 1 or more
};

// The first user to record a key owns it for that day.
struct KeyOwner {
  std::string key;
  std::int64_t user = 0;
  bool distribution = false;  // else a scalar
};

// How a key changed; borrows.
struct RecordedChange {
  enum class Kind { Add, Set, Move, Samples } kind = Kind::Add;
  std::string_view key;
  std::int64_t value = 0;  // of Add, Set and Move
  SampleColumns samples;   // of Samples
  std::int64_t user = 0;   // who recorded it, for changes that are not dated yet
};

// A change whose day was not known when it was recorded. It owns its columns.
struct UndatedChange {
  RecordedChange::Kind kind = RecordedChange::Kind::Add;
  std::string key;
  std::int64_t value = 0;
  std::vector<double> values;
  std::vector<std::uint32_t> offsets, weights;
  std::int64_t user = 0;
  std::int64_t secondsSinceBoot = 0;  // of the moment from which offsets count
};

// One transaction, which others see as a whole. The destructor undoes what was not committed; after
// a failure nothing but that is left to do. Keys are checked (1 to 512 bytes of UTF-8).
class RecordingTransaction {
 public:
  virtual ~RecordingTransaction() = default;
  // Add: to the day's scalar, or to 0; saturates at 64 bits. Set: it alone. Move: as Add, but a
  // day without the scalar begins with that of the day before. Samples: after those that the key
  // has.
  virtual Status apply(std::int32_t day, const RecordedChange& change) = 0;
  // The user who owns the key on that day; empty if nobody does.
  virtual Result<std::optional<std::int64_t>> owner(std::int32_t day, std::string_view key) = 0;
  // Ignored when the key has an owner on that day.
  virtual Status setOwner(std::int32_t day, const KeyOwner& owner) = 0;

  // Whether the last daily run wanted a figure of the recorder's own.
  virtual Result<bool> isWanted(OwnMetric, std::int32_t /*today*/) { return false; }

  // Keeps a change under a boot (its id) and the seconds since that boot, from which its samples'
  // offsets count.
  virtual Status addUndated(std::string_view boot, std::int64_t secondsSinceBoot,
                            const RecordedChange& change) = 0;
  // Takes the undated changes of the boot out of the store, in the order in which they were added;
  // at most so many at a time.
  virtual Result<std::vector<UndatedChange>> takeUndated(std::string_view boot,
                                                         std::size_t most) = 0;
  // Forgets undated changes that nobody dated within 30 days of `today`, the first such call
  // beginning to count; and the oldest while all take more than 8 MiB. Returns how many went.
  // Without a day (the clock is not set) only the latter.
  virtual Result<std::uint64_t> forgetUndated(std::optional<std::int32_t> today) = 0;

  virtual Status commit() = 0;
};

class RecordingStore {
 public:
  virtual ~RecordingStore() = default;
  // Makes the store if it is missing. Waits for the locks of others as the store does (a minute).
  virtual Result<std::unique_ptr<RecordingTransaction>> begin() = 0;
  // The owners of the day's keys; none if there is no store.
  virtual Result<std::vector<KeyOwner>> owners(std::int32_t day) = 0;
  // The newest day that holds data; empty if none does.
  virtual Result<std::optional<std::int32_t>> newestDay() = 0;
  // The value of a day's scalar; empty if it has none.
  virtual Result<std::optional<std::int64_t>> scalar(std::int32_t day, std::string_view key) = 0;
  // Returns the memory that is kept for the next transaction.
  virtual void releaseMemory() = 0;
};

}  // namespace tally
