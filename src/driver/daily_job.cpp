#include "driver/daily_job.h"

#include <cstdint>
#include <string_view>

#include "day_check/day_check.h"
#include "driver/app_info_listener.h"

namespace tally {
namespace {

// The scheduled mode ends after this long without an event.
constexpr double kQuietSeconds = 10.0;

void waitForQuiet(EventLoop& loop) {
  for (;;) {
    const SliceResult slice = loop.runMainLoopSlice(kQuietSeconds, true);
    // A loop without sources never delivers an event; restarting it would busy-wait.
    if (slice == SliceResult::TimedOut || slice == SliceResult::Finished) return;
  }
}

void runScheduled(Platform& platform, DailyTasks& tasks) {
  AppInfoListener listener(platform, tasks);
  // The loop runs without a listener too, for the same time.
  (void)listener.start();
  // A message that arrives after the listening has ended starts a new process. One that arrived
  // before is followed by a whole quiet period, since its sender may be about to send the next.
  do {
    waitForQuiet(*platform.eventLoop);
  } while (listener.stop());
  if (!listener.isAppInfoRequested()) return;
  platform.log->message(LogLevel::Default,
                        "never received requested AAI, so moving along without it");
  tasks.runIfNewDay(nullptr);
}

void runSwitch(Platform& platform, DailyTasks& tasks, std::string_view name) {
  const std::int32_t today = platform.metricsStore->TBDaysSince1970();
  if (name == "-d") {
    tasks.runIfNewDay(nullptr);
  } else if (name == "-f") {
    tasks.runDaily(today - 1, nullptr);
  } else if (name == "-t") {
    tasks.runDaily(today, nullptr);
  } else {
    platform.log->message(LogLevel::Default, "Unknown arg: {}", name);
  }
}

}  // namespace

int runDailyJob(Platform& platform, std::span<const char* const> arguments,
                ReplaceableTasks replaceable) {
  logRunStarted(*platform.log);
  DailyTasks tasks(platform, replaceable);
  if (arguments.size() == 1) {
    runScheduled(platform, tasks);
  } else if (arguments.size() > 1) {
    runSwitch(platform, tasks, arguments[1]);
  }
  logRunEnded(*platform.log);
  return 0;
}

}  // namespace tally
