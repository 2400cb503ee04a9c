#include "host/kernel/daily_amounts.h"

#include <algorithm>

#include "platform/tables/own_metrics.h"

namespace tally {

std::string eventKey(std::string_view key) { return std::string(key).append("/event"); }

void DailyAmounts::beginSample() {
  today_ = store_->TBDaysSince1970();
  kept_.clear();
  read_.clear();
  lastSweep_ = 0;
  for (CounterState& state : store_->counterStates()) {
    if (isOwnMetric(state.key)) continue;  // of the job itself: it has days of its own
    lastSweep_ = std::max(lastSweep_, state.day);
    std::string key = state.key;
    kept_.emplace(std::move(key), std::move(state));
  }
}

const CounterState* DailyAmounts::kept(const std::string& key) const {
  const auto found = kept_.find(key);
  return found != kept_.end() ? &found->second : nullptr;
}

std::optional<std::int64_t> DailyAmounts::amount(const std::string& key,
                                                 const CounterReading& reading) {
  read_.insert_or_assign(key, LastReading{reading.value, std::string(reading.epoch), reading.width,
                                          reading.isUnsteady});
  const CounterState* const state = kept(key);
  return state != nullptr ? nextState(*state, reading, today_, lastSweep_).amount : std::nullopt;
}

void DailyAmounts::commitSweep() {
  for (const auto& [key, last] : read_) {
    const CounterState* const state = kept(key);
    store_->setCounterState(state != nullptr
                                ? nextState(*state, last.reading(), today_, lastSweep_)
                                : CounterState{key, last.epoch, last.value, 0, today_, {}});
  }
}

std::size_t DailyAmounts::accumulate() {
  std::size_t count = 0;
  for (const auto& [key, last] : read_) {
    const CounterState* const state = kept(key);
    if (state == nullptr) continue;
    const CounterState next = accumulated(*state, last.reading());
    store_->setCounterState(next);
    ++count;
    // What waits for the sweep as an event.
    if (const CounterState* const event = kept(eventKey(key))) {
      CounterState waiting = next;
      waiting.key = event->key;
      waiting.sum = saturatedSum(event->sum, riseOf(*event, last.reading()));
      waiting.day = event->day;
      waiting.amount.reset();
      store_->setCounterState(waiting);
    }
  }
  return count;
}

}  // namespace tally
