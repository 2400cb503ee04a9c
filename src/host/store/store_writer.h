// Writes to the metrics store.
#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "host/store/samples/arrival_table.h"
#include "host/store/samples/sample_tail.h"
#include "host/store/store_schema.h"
#include "platform/counters/counter_state.h"
#include "platform/flash/wear_history.h"

namespace tally {

// One connection that writes. Everything between begin() and commit() is one transaction, which
// others see as a whole and which a kill or a full disk undoes as a whole; so does the destructor.
// Keys are checked here; the other arguments are taken as they are.
class StoreWriter {
 public:
  // Empty when there is no store and none is to be made.
  static Result<std::optional<StoreWriter>> open(const StoreFile& file, IfMissing ifMissing);

  Status begin();
  Status commit();
  void rollBack();

  // REQUIRES for these: a transaction has begun. After a failure it can only be rolled back.
  Status setScalar(std::int32_t day, std::string_view key, std::int64_t value);
  // Records further samples of the key, after all that it has. Both spans have the same length.
  Status pushSamples(std::int32_t day, std::string_view key, std::span<const double> values,
                     std::span<const std::uint32_t> offsets);
  // The same for many samples, straight to where a checkpoint moves them. REQUIRES: foldRecent() in
  // this transaction.
  Status appendSamples(std::int32_t day, std::string_view key, const SampleColumns& samples);
  // Puts new samples in order: those that were pushed, and those of the recorder. Damaged rows stay
  // where they are.
  Status foldRecent();
  // The same until the time is up, but for one row at least. False when there may be more.
  Result<bool> foldRecentUntil(std::chrono::steady_clock::time_point end);
  // Keeps the state of a counter.
  Status setCounter(const CounterState& state);
  // Forgets those that no sweep has seen since the day. REQUIRES: setCounter() in this transaction.
  Status forgetCountersBefore(std::int32_t day);
  // Makes the table if it is missing.
  Status addWear(std::string_view disk, const WearRow& row);
  Status forgetBefore(std::int32_t day);
  Status forgetDay(std::int32_t day);

  // Whether foldRecent() would find something to do.
  Result<bool> hasRecent();
  // The days that hold data, from the newest on; of more than 4096 the newest.
  Result<std::vector<std::int32_t>> days();
  // The bytes of all pages in use.
  Result<std::uint64_t> usedBytes();

  // Whether it has the packed schema.
  Result<bool> isPacked();
  // Gives the store the packed schema (store_conversion.h). REQUIRES: no transaction.
  Status convertToPackedSchema(const std::function<void(const std::string&)>& onFault);

 private:
  explicit StoreWriter(std::unique_ptr<Database> database) : database_(std::move(database)) {}
  Status checkKey(std::string_view key) const;
  Result<SampleTail*> tail();

  std::unique_ptr<Database> database_;  // at a place of its own, which the others know
  std::optional<Statement> setScalar_, setCounter_;
  // Of the transaction in hand.
  std::optional<ArrivalTable> arrivals_;
  std::optional<SampleTail> tail_;
};

}  // namespace tally
