// A metrics store in memory that a test fills by hand.
#pragma once

#include <algorithm>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/time_text.h"
#include "platform/clock.h"
#include "platform/metrics_store.h"

namespace tally::fakes {

using FakeSamples = std::vector<std::pair<double, std::uint32_t>>;  // value, seconds into the day

class FakeDistributionValues final : public DistributionValues {
 public:
  // A batch above zero bounds what one call delivers, as a store that reads chunk by chunk does.
  explicit FakeDistributionValues(FakeSamples samples, std::size_t batch = 0)
      : samples_(std::move(samples)), batch_(batch) {}
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) override {
    std::size_t count = std::min(capacity, samples_.size() - next_);
    if (batch_ != 0) count = std::min(count, batch_);
    for (std::size_t i = 0; i < count; ++i) {
      values[i] = samples_[next_ + i].first;
      if (offsets != nullptr) offsets[i] = samples_[next_ + i].second;
    }
    next_ += count;
    return count;
  }

 private:
  FakeSamples samples_;
  std::size_t batch_, next_ = 0;
};

// Rows by day and key, which is also the order in which they are enumerated.
struct FakeRows {
  using Place = std::pair<std::int32_t, std::string>;
  std::map<Place, std::int64_t> scalars;
  std::map<Place, FakeSamples> distributions;
  std::size_t batch = 0;
};

class FakeHistoryStore final : public HistoryStore {
 public:
  explicit FakeHistoryStore(FakeRows rows) : rows_(std::move(rows)) {}
  void enumerateScalars(std::string_view keyPrefix, std::int32_t minimumDay,
                        std::int32_t maximumDay, const ScalarHandler& handler) override {
    each(rows_.scalars, keyPrefix, minimumDay, maximumDay,
         [&](const FakeRows::Place& place, std::int64_t value, bool& stop) {
           handler(place.second, place.first, value, stop);
         });
  }
  void enumerateDistributions(std::string_view keyPrefix, std::int32_t minimumDay,
                              std::int32_t maximumDay, const DistributionHandler& handler,
                              const KeyFilter& wanted) override {
    each(rows_.distributions, keyPrefix, minimumDay, maximumDay,
         [&](const FakeRows::Place& place, const FakeSamples& samples, bool& stop) {
           if (wanted && !wanted(place.second)) return;
           FakeDistributionValues values(samples, rows_.batch);
           handler(place.second, place.first, values, stop);
         });
  }

 private:
  template <class Rows, class Handler>
  static void each(const Rows& rows, std::string_view prefix, std::int32_t minimumDay,
                   std::int32_t maximumDay, const Handler& handler) {
    bool stop = false;
    for (const auto& [place, value] : rows) {
      if (place.first <= minimumDay || place.first > maximumDay) continue;
      if (!place.second.starts_with(prefix)) continue;
      handler(place, value, stop);
      if (stop) return;
    }
  }
  FakeRows rows_;
};

struct FakeMetricsStore final : MetricsStore {
  std::shared_ptr<std::vector<std::string>> calls;
  std::shared_ptr<Clock> clock;
  FakeRows rows;
  std::map<std::string, std::vector<WearRow>, std::less<>> wears;
  std::map<std::string, CounterState, std::less<>> counters;
  int countersRead = 0;
  int batchDepth = 0, historiesOpened = 0;

  std::int32_t TBDaysSince1970() override { return dayOfSeconds(clock->secondsSince1970()); }
  void TBClientCheckpoint() override { calls->push_back("TBClientCheckpoint"); }
  void TBClientSetValueForScalarKey(std::string_view key, std::int64_t value) override {
    calls->push_back("scalar " + std::string(key) + "=" + std::to_string(value));
    rows.scalars[{TBDaysSince1970(), std::string(key)}] = value;
  }
  std::vector<CounterState> counterStates() override {
    ++countersRead;
    std::vector<CounterState> states;
    for (const auto& [key, state] : counters) states.push_back(state);
    return states;
  }
  void setCounterState(const CounterState& state) override { counters[state.key] = state; }
  void beginBatch() override { ++batchDepth; }
  void endBatch() override { --batchDepth; }
  std::unique_ptr<HistoryStore> openHistory() override {
    ++historiesOpened;
    return std::make_unique<FakeHistoryStore>(rows);
  }
  std::vector<WearRow> wearHistory(std::string_view disk) override {
    const auto found = wears.find(disk);
    return found == wears.end() ? std::vector<WearRow>() : found->second;
  }
  void addWear(std::string_view disk, const WearRow& row) override {
    if (batchDepth == 0) return;  // it is to be part of the sweep's transaction
    wears[std::string(disk)].push_back(row);
  }

  void putScalar(std::int32_t day, std::string_view key, std::int64_t value) {
    rows.scalars[{day, std::string(key)}] = value;
  }
  // Samples one second apart.
  void putDistribution(std::int32_t day, std::string_view key, const std::vector<double>& values) {
    FakeSamples& samples = rows.distributions[{day, std::string(key)}];
    for (const double value : values) {
      samples.emplace_back(value, static_cast<std::uint32_t>(samples.size()));
    }
  }
};

}  // namespace tally::fakes
