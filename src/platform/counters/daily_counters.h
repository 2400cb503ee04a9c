// The counters that restart with the kernel or their device, and are reported by the day.
#pragma once

#include <cstddef>

namespace tally {

class DailyCounters {
 public:
  virtual ~DailyCounters() = default;
  // Keeps what the last sample of this process read, as the day's sweep. For the driver alone, in
  // the batch of the scalars: it ends the day's amounts.
  virtual void commitSweep() {}
  // Keeps it without ending anything, so that little is lost when counters restart. Returns how
  // many counters that is.
  virtual std::size_t accumulate() { return 0; }
};

}  // namespace tally
