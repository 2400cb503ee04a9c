#include "host/kernel/daily_amounts.h"

#include <algorithm>

namespace tally {
namespace {

// 2^width - 1.
std::uint64_t largestOf(std::uint8_t width) {
  return width >= 64 ? UINT64_MAX : (std::uint64_t{1} << width) - 1;
}

std::int64_t saturated(std::uint64_t value) {
  return value > std::uint64_t{INT64_MAX} ? INT64_MAX : static_cast<std::int64_t>(value);
}

std::uint64_t sumOf(std::uint64_t a, std::uint64_t b) {
  return a > UINT64_MAX - b ? UINT64_MAX : a + b;
}

// What the next rise of a counter begins at. One that wavers rises above its highest value only.
std::uint64_t nextLast(const CounterState& kept, const CounterReading& reading) {
  constexpr std::uint64_t kWavering = 3000;  // an idle time falls by less, unless a processor went
  const bool wavers = reading.isUnsteady && kept.epoch == reading.epoch &&
                      reading.value < kept.last && kept.last - reading.value < kWavering;
  return wavers ? kept.last : reading.value;
}

}  // namespace

std::uint64_t riseOf(const CounterState& kept, const CounterReading& reading) {
  if (kept.epoch != reading.epoch) return reading.value;
  if (reading.value >= kept.last) return reading.value - kept.last;
  if (reading.isUnsteady) return 0;
  const std::uint64_t largest = largestOf(reading.width);
  const bool wrapped = reading.width != 0 && kept.last <= largest && kept.last > largest / 4 * 3;
  return wrapped ? largest - kept.last + 1 + reading.value : reading.value;
}

CounterState nextState(const CounterState& kept, const CounterReading& reading, std::int32_t today,
                       std::int32_t lastSweep) {
  CounterState next = kept;
  next.sum = sumOf(kept.sum, riseOf(kept, reading));
  if (today > kept.day) {
    next.amount.reset();
    if (kept.day >= lastSweep) next.amount = saturated(next.sum);
    next.sum = 0;
  } else if (today < kept.day) {
    next.amount.reset();  // the clock was set back: of which days the sum is will not be known
  }
  next.day = today;
  next.last = nextLast(kept, reading);
  next.epoch = reading.epoch;
  return next;
}

std::string eventKey(std::string_view key) { return std::string(key).append("/event"); }

void DailyAmounts::beginSample() {
  today_ = store_->TBDaysSince1970();
  kept_.clear();
  read_.clear();
  lastSweep_ = 0;
  for (CounterState& state : store_->counterStates()) {
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
    CounterState next = *state;
    next.sum = sumOf(state->sum, riseOf(*state, last.reading()));
    next.last = nextLast(*state, last.reading());
    next.epoch = last.epoch;
    store_->setCounterState(next);
    ++count;
    // What waits for the sweep as an event.
    if (const CounterState* const event = kept(eventKey(key))) {
      CounterState waiting = next;
      waiting.key = event->key;
      waiting.sum = sumOf(event->sum, riseOf(*event, last.reading()));
      waiting.day = event->day;
      waiting.amount.reset();
      store_->setCounterState(waiting);
    }
  }
  return count;
}

}  // namespace tally
