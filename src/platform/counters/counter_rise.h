// By how much a counter rose that restarts, from reading to reading and from day to day.
#pragma once

#include <cstdint>
#include <string_view>

#include "platform/counters/counter_state.h"

namespace tally {

// A counter as it was just read.
struct CounterReading {
  std::uint64_t value = 0;
  // As long as it is the same, the counter goes on: the boot, or the device that it belongs to.
  std::string_view epoch;
  std::uint8_t width = 64;
  bool isUnsteady = false;  // a fall does not mean that it started again
};

// How much a counter rose since its state was kept. Where it started again, what it counts since
// then is all that is known.
std::uint64_t riseOf(const CounterState& kept, const CounterReading& reading);

// The state with a reading, of the same day.
CounterState accumulated(const CounterState& kept, const CounterReading& reading);

// The state with a rise, as of a sweep of a day: the day's amount is fixed by its first sweep.
// lastSweep is the day of the sweep before; a counter that was missing from it has no amount of
// that day.
CounterState sweptState(const CounterState& kept, std::uint64_t rise, std::int32_t today,
                        std::int32_t lastSweep);
// The same with a reading.
CounterState nextState(const CounterState& kept, const CounterReading& reading, std::int32_t today,
                       std::int32_t lastSweep);

std::uint64_t saturatedSum(std::uint64_t a, std::uint64_t b);

}  // namespace tally
