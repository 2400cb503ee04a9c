// The metrics store: per-day scalars and distributions.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "base/time_text.h"
#include "kv/value.h"
#include "platform/counters/counter_state.h"
#include "platform/flash/wear_history.h"

namespace tally {

// The file of the store on a device.
inline constexpr std::string_view kStorePath = "/var/mobile/Library/Tallybook/TBDataStore.sqlitedb";

// The samples of one distribution key on one day, in the order in which they were recorded.
class DistributionValues {
 public:
  virtual ~DistributionValues() = default;
  // Copies up to capacity further samples to values, and each one's seconds into the day to
  // offsets unless that is null. Returns how many; 0 at the end.
  virtual std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) = 0;
  // How many samples each of those stands for that the last call delivered, 1 or more; empty if
  // each counts once. Valid until the next call.
  virtual std::span<const std::uint32_t> weights() const { return {}; }
  // The next sample and its seconds into the day; false at the end.
  bool nextValue(double* value, std::uint32_t* offset) { return nextValues(value, offset, 1) == 1; }
};

// Reads a consistent state of the store: what others write meanwhile is not seen.
class HistoryStore {
 public:
  // stop is false at the call; setting it ends the enumeration after this row.
  using ScalarHandler =
      std::function<void(std::string_view key, std::int32_t day, std::int64_t value, bool& stop)>;
  using DistributionHandler = std::function<void(std::string_view key, std::int32_t day,
                                                 DistributionValues& values, bool& stop)>;
  // Whether rows of the key are wanted.
  using KeyFilter = std::function<bool(std::string_view key)>;
  virtual ~HistoryStore() = default;
  // Calls the handler, before returning, for every row whose key begins with keyPrefix and whose
  // day lies in (minimumDay, maximumDay], ordered by day and then by key (bytewise). With a filter,
  // rows of other keys are passed over without reading their samples.
  virtual void enumerateScalars(std::string_view keyPrefix, std::int32_t minimumDay,
                                std::int32_t maximumDay, const ScalarHandler& handler) = 0;
  virtual void enumerateDistributions(std::string_view keyPrefix, std::int32_t minimumDay,
                                      std::int32_t maximumDay, const DistributionHandler& handler,
                                      const KeyFilter& wanted) = 0;
  void enumerateDistributions(std::string_view keyPrefix, std::int32_t minimumDay,
                              std::int32_t maximumDay, const DistributionHandler& handler) {
    enumerateDistributions(keyPrefix, minimumDay, maximumDay, handler, nullptr);
  }
  // Whether any sample counts for more than one.
  virtual bool hasWeights() { return false; }
  // Rows that the enumerations until now left out, being damaged; empty if one could not be read to
  // its end.
  virtual std::optional<std::uint64_t> damagedRows() { return 0; }
};

// The instant at which a day begins (UTC).
inline KvRef<KvDate> DayToDate(std::int32_t day) {
  return KvDate::create(static_cast<double>(day) * kSecondsPerDay);
}

class MetricsStore {
 public:
  virtual ~MetricsStore() = default;
  // Whole days since 1970-01-01 UTC, now.
  virtual std::int32_t TBDaysSince1970() = 0;
  // Folds new samples into their day's chunks and forgets old days.
  virtual void TBClientCheckpoint() = 0;
  // Sets the scalar for the day in progress; a store that does not exist yet is created. A failure
  // is logged.
  virtual void TBClientSetValueForScalarKey(std::string_view key, std::int64_t value) = 0;
  // All counters that are kept; none when the store cannot be read, which is logged.
  virtual std::vector<CounterState> counterStates() { return {}; }
  // Keeps a counter, in the order of the scalars.
  virtual void setCounterState(const CounterState&) {}
  // Scalars and counters set between these two are one transaction.
  virtual void beginBatch() = 0;
  virtual void endBatch() = 0;
  // Ends what is kept open between the writes of a run; a later write opens it again.
  virtual void close() {}
  // The history of the store on its default path. Never null: a store that is missing has no rows,
  // one that cannot be read has none either and the reason is logged at error level.
  virtual std::unique_ptr<HistoryStore> openHistory() = 0;
  // The recorded wear of a disk, oldest first; none if there is no store. A failure is logged.
  virtual std::vector<WearRow> wearHistory(std::string_view) { return {}; }
  // Records the wear of a disk, once for each day; within a batch, as part of its transaction.
  // Kept however old it gets. Ignored while the clock is not set.
  virtual void addWear(std::string_view, const WearRow&) {}
};

}  // namespace tally
