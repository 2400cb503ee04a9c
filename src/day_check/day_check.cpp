#include "day_check/day_check.h"

#include "platform/tables/known_preferences.h"

namespace tally {

DayCheck checkDay(Preferences& preferences, std::int32_t today) {
  return {.yesterday = today - 1,
          .last = preferences.SMAPreferencesGetIntegerValue(kLastProcessedDay.key,
                                                            kLastProcessedDay.domain)};
}

void logDayUnchanged(SystemLog& log, const DayCheck& check) {
  log.message(LogLevel::Default, "Day unchanged since last run");
  if (check.last > check.yesterday) {
    log.message(LogLevel::Error,
                "day {} counts as processed, but by the clock it is not over: no day is processed "
                "until then; see tallyctl doctor",
                check.last);
  }
}

void logRunStarted(SystemLog& log) { log.message(LogLevel::Default, "tallyrun started"); }

void logRunEnded(SystemLog& log) {
  log.writeOmitted();
  log.message(LogLevel::Default, "tallyrun ended");
}

}  // namespace tally
