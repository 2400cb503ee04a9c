// The wall clock of the system.
#pragma once

#include <time.h>

#include "platform/clock.h"

namespace tally {

class LinuxClock final : public Clock {
 public:
  double secondsSince1970() const override {
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
  }
};

}  // namespace tally
