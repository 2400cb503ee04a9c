// The wall clock.
#pragma once

namespace tally {

class Clock {
 public:
  virtual ~Clock() = default;
  // Seconds since 1970-01-01 00:00 UTC.
  virtual double secondsSince1970() const = 0;
};

}  // namespace tally
