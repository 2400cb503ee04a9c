#include "platform/counters/counter_rise.h"

namespace tally {
namespace {

// 2^width - 1.
std::uint64_t largestOf(std::uint8_t width) {
  return width >= 64 ? UINT64_MAX : (std::uint64_t{1} << width) - 1;
}

std::int64_t saturated(std::uint64_t value) {
  return value > std::uint64_t{INT64_MAX} ? INT64_MAX : static_cast<std::int64_t>(value);
}

// What the next rise of a counter begins at. One that wavers rises above its highest value only.
std::uint64_t nextLast(const CounterState& kept, const CounterReading& reading) {
  constexpr std::uint64_t kWavering = 3000;  // an idle time falls by less, unless a processor went
  const bool wavers = reading.isUnsteady && kept.epoch == reading.epoch &&
                      reading.value < kept.last && kept.last - reading.value < kWavering;
  return wavers ? kept.last : reading.value;
}

}  // namespace

std::uint64_t saturatedSum(std::uint64_t a, std::uint64_t b) {
  return a > UINT64_MAX - b ? UINT64_MAX : a + b;
}

std::uint64_t riseOf(const CounterState& kept, const CounterReading& reading) {
  if (kept.epoch != reading.epoch) return reading.value;
  if (reading.value >= kept.last) return reading.value - kept.last;
  if (reading.isUnsteady) return 0;
  const std::uint64_t largest = largestOf(reading.width);
  const bool wrapped = reading.width != 0 && kept.last <= largest && kept.last > largest / 4 * 3;
  return wrapped ? largest - kept.last + 1 + reading.value : reading.value;
}

CounterState accumulated(const CounterState& kept, const CounterReading& reading) {
  CounterState next = kept;
  next.sum = saturatedSum(kept.sum, riseOf(kept, reading));
  next.last = nextLast(kept, reading);
  next.epoch = reading.epoch;
  return next;
}

CounterState sweptState(const CounterState& kept, std::uint64_t rise, std::int32_t today,
                        std::int32_t lastSweep) {
  CounterState next = kept;
  next.sum = saturatedSum(kept.sum, rise);
  if (today > kept.day) {
    next.amount.reset();
    if (kept.day >= lastSweep) next.amount = saturated(next.sum);
    next.sum = 0;
  } else if (today < kept.day) {
    next.amount.reset();  // the clock was set back: of which days the sum is will not be known
  }
  next.day = today;
  return next;
}

CounterState nextState(const CounterState& kept, const CounterReading& reading, std::int32_t today,
                       std::int32_t lastSweep) {
  CounterState next = sweptState(kept, riseOf(kept, reading), today, lastSweep);
  next.last = nextLast(kept, reading);
  next.epoch = reading.epoch;
  return next;
}

}  // namespace tally
