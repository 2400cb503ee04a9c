// The check whether there is a day to process, and the lines of a run that finds none. Apart from
// the rest of the job, which such a run need not load.
#pragma once

#include <cstdint>

#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// Days since 1970-01-01.
struct DayCheck {
  std::int32_t yesterday = 0;  // the day to process
  std::int32_t last = 0;       // that was processed; 0 when none was
  bool isDone() const { return last >= yesterday; }
};
DayCheck checkDay(Preferences& preferences, std::int32_t today);
// Says that the day is done. REQUIRES: check.isDone().
void logDayUnchanged(SystemLog& log, const DayCheck& check);

// The first and the last line of every run.
void logRunStarted(SystemLog& log);
void logRunEnded(SystemLog& log);

}  // namespace tally
