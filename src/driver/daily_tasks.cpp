#include "driver/daily_tasks.h"

#include <cerrno>
#include <chrono>

#include "config/whitelist_file.h"
#include "day_check/day_check.h"
#include "driver/own_figures.h"
#include "platform/tables/known_preferences.h"
#include "report/daily_report.h"

namespace tally {
namespace {

// Whether the device has no whitelist yet. One that exists but cannot be read or parsed is a
// fault, which the report logs.
bool whitelistIsMissing(Files& files) {
  // With the limit 0, a file that exists is rejected by its size without being read.
  const auto bytes = files.readFile(kWhitelistPath, 0);
  return !bytes && bytes.error().systemError == ENOENT;
}

// What the recorder holds in memory of the day that is to be reported.
void commitRecorded(Platform& platform) {
  constexpr std::chrono::seconds kPatience{30};
  const auto committed = platform.recorder->commit(kPatience);
  if (!committed) platform.log->fault("recorder", "{}", committed.error().message);
}

}  // namespace

void DailyTasks::runIfNewDay(const KvArray* appInfo) {
  // The lock comes first: another run may be processing the very day.
  const RunTurn turn(*platform_.runLock);
  if (!turn) return;
  SystemLog& log = *platform_.log;
  Preferences& preferences = *platform_.preferences;
  const DayCheck check = checkDay(preferences, platform_.metricsStore->TBDaysSince1970());
  if (check.isDone()) {
    logDayUnchanged(log, check);
    return;
  }
  const std::int32_t yesterday = check.yesterday;
  // Asked before the day's work: a whitelist that arrives meanwhile has admitted nothing yet.
  const bool nothingAdmits = whitelistIsMissing(*platform_.files);
  runDaily(yesterday, appInfo);
  if (nothingAdmits) {
    log.message(LogLevel::Default,
                "no whitelist is installed yet, so day {} stays unprocessed until there is one",
                yesterday);
    return;
  }
  preferences.set(kLastProcessedDay, KvNumber::int32(yesterday));
  preferences.SMAPreferencesSynchronize(kLastProcessedDay.domain);
}

void DailyTasks::runDaily(std::int32_t day, const KvArray* appInfo) {
  const RunTurn turn(*platform_.runLock);
  if (!turn) return;
  platform_.log->message(LogLevel::Default, "daily tasks for day {}", day);
  commitRecorded(platform_);
  platform_.metricsStore->TBClientCheckpoint();
  CrashReporting& crashReporting = *platform_.crashReporting;
  OwnMetrics own;
  if (crashReporting.isDiagnosticSubmissionEnabled()) own = writeDailyLog(platform_, day, appInfo);
  tasks_.runTelemetrySweep(platform_);
  crashReporting.FDDumpAllOldStructuredDataLogs();
  tasks_.updateTaskingState(platform_);
  crashReporting.rollFixlineLogs();
  recordOwnFigures(platform_, own);  // last, so that it knows what all of this cost
  platform_.metricsStore->close();   // its files are gone before the day's last write is synced
}

}  // namespace tally
