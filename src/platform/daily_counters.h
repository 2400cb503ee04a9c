// The counters that restart with the kernel or their device, and are reported by the day.
#pragma once

namespace tally {

class DailyCounters {
 public:
  virtual ~DailyCounters() = default;
  // Keeps what the last sample of this process read, as the day's sweep. For the driver alone, in
  // the batch of the scalars: it ends the day's amounts.
  virtual void commitSweep() {}
  // Keeps it without ending anything, so that little is lost when counters restart.
  virtual void accumulate() {}
};

}  // namespace tally
