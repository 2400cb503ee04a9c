#include "driver/daily_job.h"

#include <cerrno>
#include <string_view>

#include "config/whitelist_file.h"
#include "platform/platform.h"
#include "report/report.h"

namespace tally {
namespace {

// The scheduled mode ends when no event came for this long.
constexpr double kQuietSeconds = 10.0;

// True when the device has no whitelist yet. One that is there but cannot be read or parsed is a
// fault of its own, which the report names.
bool whitelistIsMissing() {
  // A limit of nothing: a file that is there is rejected by its size, unread.
  const auto bytes = platform().files->readFile(kWhitelistPath, 0);
  return !bytes && bytes.error().systemError == ENOENT;
}

}  // namespace

int DailyJob::run(std::span<const char* const> arguments) {
  logMessage(LogLevel::Default, "tallyrun started");
  if (arguments.size() == 1) {
    runScheduled();
  } else if (arguments.size() > 1) {
    runSwitch(arguments[1]);
  }
  platform().log->writeOmitted();
  logMessage(LogLevel::Default, "tallyrun ended");
  return 0;
}

void DailyJob::runScheduled() {
  // Without a listener the loop still runs its time: a peer may only be late.
  if (capabilities_.startListener) capabilities_.startListener(*this);
  // A message that comes once the listening has ended starts a new process. One that came before
  // gets a whole quiet period like any other, since its sender may be about to send the next.
  do {
    waitForQuiet();
  } while (capabilities_.stopListener && capabilities_.stopListener());
  if (!appInfoRequested) return;
  logMessage(LogLevel::Default, "never received requested AAI, so moving along without it");
  runIfNewDay(nullptr);
}

void DailyJob::waitForQuiet() {
  for (;;) {
    const SliceResult slice = platform().eventLoop->runMainLoopSlice(kQuietSeconds, true);
    // A loop without sources will never deliver: starting it again at once would only spin.
    if (slice == SliceResult::TimedOut || slice == SliceResult::Finished) return;
  }
}

void DailyJob::runSwitch(const char* argument) {
  const std::int32_t today = platform().metricsStore->TBDaysSince1970();
  const std::string_view name = argument;
  if (name == "-d") {
    runIfNewDay(nullptr);
  } else if (name == "-f") {
    runDaily(today - 1, nullptr);
  } else if (name == "-t") {
    runDaily(today, nullptr);
  } else {
    logMessage(LogLevel::Default, "Unknown arg: {}", name);
  }
}

void DailyJob::runIfNewDay(const KvArray* appInfo) {
  // Waiting for another run comes first: it may be processing the very day.
  const RunTurn turn(*platform().runLock);
  if (!turn) return;
  const std::int32_t yesterday = platform().metricsStore->TBDaysSince1970() - 1;
  Preferences& preferences = *platform().preferences;
  const std::int32_t last =
      preferences.SMAPreferencesGetIntegerValue(kLastProcessedDay, kProgramDomain);
  if (last >= yesterday) {
    logMessage(LogLevel::Default, "Day unchanged since last run");
    if (last > yesterday) {
      logMessage(LogLevel::Error,
                 "day {} counts as processed, but by the clock it is not over: no day is processed "
                 "until then; see tallyctl doctor",
                 last);
    }
    return;
  }
  // Asked before the day's work: a whitelist that arrives meanwhile has admitted nothing yet.
  const bool nothingAdmits = whitelistIsMissing();
  runDaily(yesterday, appInfo);
  if (nothingAdmits) {
    logMessage(LogLevel::Default,
               "no whitelist is installed yet, so day {} stays unprocessed until there is one",
               yesterday);
    return;
  }
  preferences.SMAPreferencesSetValue(kLastProcessedDay, KvNumber::int32(yesterday), kProgramDomain);
  preferences.SMAPreferencesSynchronize(kProgramDomain);
}

void DailyJob::runDaily(std::int32_t day, const KvArray* appInfo) {
  const RunTurn turn(*platform().runLock);
  if (!turn) return;
  logMessage(LogLevel::Default, "daily tasks for day {}", day);
  platform().metricsStore->TBClientCheckpoint();
  CrashReporting& crashReporting = *platform().crashReporting;
  if (crashReporting.isDiagnosticSubmissionEnabled()) {
    TBReport().writeLogForYesterdayWithAppInfo(day, appInfo);
  }
  if (capabilities_.runTelemetrySweep) capabilities_.runTelemetrySweep();
  crashReporting.FDDumpAllOldStructuredDataLogs();
  if (capabilities_.updateTaskingState) capabilities_.updateTaskingState();
  crashReporting.rollFixlineLogs();
}

}  // namespace tally
