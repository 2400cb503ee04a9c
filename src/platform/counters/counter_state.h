// What is kept of a counter that restarts, so that its rise over a day can be told.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace tally {

struct CounterState {
  std::string key;
  std::string epoch;       // of the last reading: the counter goes on while it is the same
  std::uint64_t last = 0;  // the last reading
  std::uint64_t sum = 0;   // the rise since the first sweep of `day`, up to it
  std::int32_t day = 0;    // of the last sweep
  std::optional<std::int64_t> amount;  // the rise from the sweep before to the first of `day`
};

}  // namespace tally
