// The wall clock.
#pragma once

#include <cstdint>

namespace tally {

// 2024-01-01, before the first device that runs this was made: an earlier clock was never set.
constexpr std::int32_t kFirstPlausibleDay = 19723;

class Clock {
 public:
  virtual ~Clock() = default;
  // Seconds since 1970-01-01 00:00 UTC.
  virtual double secondsSince1970() const = 0;
};

}  // namespace tally
