// By how much counters rose between the first sweeps of two days.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/clock.h"
#include "platform/counters/counter_rise.h"
#include "platform/counters/counter_state.h"
#include "platform/counters/daily_counters.h"
#include "platform/metrics_store.h"

namespace tally {

// Under which what a counter rose by is kept until a sweep forwards it as an event.
std::string eventKey(std::string_view key);

// One thread at a time.
class DailyAmounts final : public DailyCounters {
 public:
  DailyAmounts(std::shared_ptr<MetricsStore> store, std::shared_ptr<const Clock> clock)
      : store_(std::move(store)), clock_(std::move(clock)) {}

  // Begins a sample of counters: what was kept is read again, what was read before is forgotten.
  void beginSample();
  // The amount of the day in progress; empty on the day on which the counter is first seen. What is
  // kept does not change before commitSweep() or accumulate().
  std::optional<std::int64_t> amount(const std::string& key, const CounterReading& reading);
  double secondsSince1970() const { return clock_->secondsSince1970(); }

  void commitSweep() override;
  std::size_t accumulate() override;

 private:
  struct LastReading {
    std::uint64_t value;
    std::string epoch;
    std::uint8_t width;
    bool isUnsteady;
    CounterReading reading() const { return {value, epoch, width, isUnsteady}; }
  };
  const CounterState* kept(const std::string& key) const;

  std::shared_ptr<MetricsStore> store_;
  std::shared_ptr<const Clock> clock_;
  std::int32_t today_ = 0, lastSweep_ = 0;
  std::map<std::string, CounterState, std::less<>> kept_;
  std::map<std::string, LastReading, std::less<>> read_;
};

}  // namespace tally
