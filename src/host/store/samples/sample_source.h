// The tables that hold samples, each read in the order of day, key and number.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "host/store/sqlite_database.h"
#include "host/store/store_rows.h"
#include "platform/metrics_store.h"

namespace tally {

using SamplePlace = std::pair<std::int32_t, std::string_view>;  // day and key

// A cursor over one table, and over the samples of one key on one day. Both go forwards alone.
class SampleSource {
 public:
  virtual ~SampleSource() = default;

  // Where the next row is.
  bool atEnd() const { return atEnd_; }
  SamplePlace place() const { return {day_, key_}; }
  // Goes on to the next row that can be read. It may be of the same key.
  virtual void advance() = 0;

  // Begins to read the samples of a key on a day, which may be none.
  virtual void openSamples(std::int32_t day, std::string_view key) = 0;
  // As of DistributionValues, for this table alone.
  virtual std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) = 0;
  virtual std::span<const std::uint32_t> weights() const { return {}; }
  virtual void closeSamples() = 0;

 protected:
  void moveTo(std::int64_t day, std::string_view key) {
    day_ = static_cast<std::int32_t>(day);
    if (key_ != key) key_ = key;
  }
  void end() { atEnd_ = true; }

 private:
  bool atEnd_ = false;
  std::int32_t day_ = 0;
  std::string key_;
};

using SampleSources = std::vector<std::unique_ptr<SampleSource>>;

// The sources of a store in the order in which the samples of a key were recorded: chunks, recent
// and packed of schema version 1, series, arrivals; without those that the store lacks. They borrow
// all arguments. An empty filter wants every key.
SampleSources openSampleSources(Database& database, StoreFaults& faults, const StoreRange& range,
                                const HistoryStore::KeyFilter& wanted);

// Calls the handler for each key on each day, in that order, with its samples from all sources.
void enumerateSources(const SampleSources& sources,
                      const HistoryStore::DistributionHandler& handler);

}  // namespace tally
