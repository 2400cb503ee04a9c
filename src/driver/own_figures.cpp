#include "driver/own_figures.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <limits>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/counters/counter_rise.h"

namespace tally {
namespace {

// Steps of the clock that are smaller pass for the uncertainty of reading it.
constexpr std::int64_t kSmallestStep = 100;  // in milliseconds
constexpr std::int64_t kMilliseconds = 1000;

// What an observation adds to a figure, and what the next one is compared with.
struct Observed {
  std::uint64_t rise = 0;
  std::uint64_t last = 0;
};

// Set to another time, the clock is no longer as far from the time since boot as it was.
Observed observeStep(const CounterState& kept, const ClockReading& now) {
  const std::int64_t since1970AtBoot = now.milliseconds - now.bootMilliseconds;
  std::int64_t moved = 0;
  if (__builtin_sub_overflow(since1970AtBoot, static_cast<std::int64_t>(kept.last), &moved)) {
    moved = std::numeric_limits<std::int64_t>::max();
  }
  const bool isStep = kept.epoch == now.bootId && std::abs(moved) >= kSmallestStep;
  return {isStep ? 1u : 0u, static_cast<std::uint64_t>(since1970AtBoot)};
}

Observed observeCounter(const CounterState& kept, const ClockReading& now, std::uint64_t value) {
  const CounterReading reading{.value = value, .epoch = now.bootId, .isUnsteady = true};
  const bool isFirst = kept.epoch.empty();  // nobody knows since when it counts
  return {isFirst ? 0 : riseOf(kept, reading), accumulated(kept, reading).last};
}

// Empty when the kernel does not say.
std::optional<Observed> observe(OwnMetric metric, const CounterState& kept,
                                const ClockReading& now) {
  switch (metric) {
    case OwnMetric::Synchronised:
      if (!now.isSynchronised) return std::nullopt;
      return Observed{*now.isSynchronised ? 0u : 1u, 0};
    case OwnMetric::ClockSteps:
      return observeStep(kept, now);
    case OwnMetric::Boots:
      return observeCounter(kept, now, 1);
    case OwnMetric::Suspended:
      return observeCounter(kept, now,
                            static_cast<std::uint64_t>(std::max<std::int64_t>(
                                now.bootMilliseconds - now.awakeMilliseconds, 0)));
    default:
      return std::nullopt;
  }
}

std::int64_t reported(OwnMetric metric, std::int64_t amount) {
  if (metric == OwnMetric::Synchronised) return amount == 0 ? 1 : 0;
  return metric == OwnMetric::Suspended ? amount / kMilliseconds : amount;
}

bool isObserved(OwnMetric metric) { return rowOf(metric).source == OwnSource::Observations; }

class OwnFigures {
 public:
  explicit OwnFigures(Platform& platform)
      : store_(*platform.metricsStore),
        today_(store_.TBDaysSince1970()),
        states_(store_.counterStates()) {
    std::erase_if(states_, [](const CounterState& state) { return !isOwnMetric(state.key); });
    clocks_ = platform.self->clocks();
  }

  // Ends what was counted since yesterday's run, and begins anew.
  void endDay(OwnMetric metric) {
    CounterState next{std::string(rowOf(metric).key), "", 0, 0, today_, {}};
    const CounterState* const kept = stateOf(metric);
    const auto found = observation(metric, kept != nullptr ? *kept : next);
    if (found && kept != nullptr) next = sweptState(*kept, found->rise, today_, today_ - 1);
    if (found) takeOver(next, *found);
    if (next.amount) {
      store_.TBClientSetValueForScalarKey(next.key, reported(metric, *next.amount));
    }
    store_.setCounterState(next);
  }

  void accumulate(OwnMetric metric) {
    const CounterState* const kept = stateOf(metric);
    if (kept == nullptr || !isStillWanted(kept->day, today_)) return;
    const auto found = observation(metric, *kept);
    if (!found) return;
    CounterState next = *kept;
    next.sum = saturatedSum(kept->sum, found->rise);
    takeOver(next, *found);
    store_.setCounterState(next);
  }

  // The recorder looks for the row, and counts by itself.
  void askRecorder() {
    store_.setCounterState({std::string(rowOf(OwnMetric::RecorderRan).key), "", 0, 0, today_, {}});
  }

 private:
  const CounterState* stateOf(OwnMetric metric) const {
    const auto found = std::ranges::find(states_, rowOf(metric).key, &CounterState::key);
    return found != states_.end() ? &*found : nullptr;
  }
  std::optional<Observed> observation(OwnMetric metric, const CounterState& kept) const {
    if (!clocks_ || clocks_->bootId.empty()) return std::nullopt;
    return observe(metric, kept, *clocks_);
  }
  void takeOver(CounterState& state, const Observed& found) const {
    state.last = found.last;
    state.epoch = clocks_->bootId;
  }

  MetricsStore& store_;
  const std::int32_t today_;
  std::vector<CounterState> states_;
  std::optional<ClockReading> clocks_;
};

void recordCost(Platform& platform, const OwnMetrics& wanted) {
  const auto isCost = [](const OwnMetricRow& row) { return row.source == OwnSource::Run; };
  const auto record = [&](OwnMetric metric, std::optional<std::int64_t> value) {
    if (!wanted.has(metric) || !value) return;
    platform.metricsStore->TBClientSetValueForScalarKey(rowOf(metric).key, *value);
  };
  static_assert(std::ranges::count_if(kOwnMetrics, isCost) == 3);
  const RunCost cost = platform.self->cost();
  record(OwnMetric::Cpu, cost.cpuMilliseconds);
  record(OwnMetric::PeakMemory, cost.peakKibibytes);
  record(OwnMetric::BytesWritten, cost.bytesWritten);
}

template <class Function>
void eachObserved(const Function& function) {
  for (std::size_t i = 0; i < kOwnMetricCount; ++i) {
    if (isObserved(static_cast<OwnMetric>(i))) function(static_cast<OwnMetric>(i));
  }
}

}  // namespace

void recordOwnFigures(Platform& platform, const OwnMetrics& wanted) {
  if (wanted.empty()) return;
  platform.metricsStore->beginBatch();
  OwnFigures figures(platform);
  eachObserved([&](OwnMetric metric) {
    if (wanted.has(metric)) figures.endDay(metric);
  });
  if (wanted.has(OwnMetric::RecorderRan) || wanted.has(OwnMetric::RefusedInAll)) {
    figures.askRecorder();
  }
  recordCost(platform, wanted);
  platform.metricsStore->endBatch();
}

void keepOwnFigures(Platform& platform) {
  OwnFigures figures(platform);
  eachObserved([&](OwnMetric metric) { figures.accumulate(metric); });
}

}  // namespace tally
