// tallyrun: the daily job. Most day checks find the day done, and end here. All other runs are the
// day module's, which is linked with the store, the bus and whatever else a day needs.
#include <cstdio>
#include <cstring>
#include <string_view>

#include "base/process.h"
#include "base/time_text.h"
#include "base/version.h"
#include "day_check/day_check.h"
#include "day_module.h"
#include "host/preferences/property_list_preferences.h"
#include "host/system/clock.h"
#include "host/system/environment.h"
#include "host/system/private_module.h"
#include "host/system/run_lock.h"
#include "host/system/system_log.h"

namespace tally {
namespace {

// Notes whether there was anything to say.
class SilentLog final : public SystemLog {
 public:
  bool enabled(LogLevel) const override { return true; }
  void write(LogLevel, std::string_view) override { spoken_ = true; }
  bool hasSpoken() const { return spoken_; }

 private:
  bool spoken_ = false;
};

// Does the run of a day check if the day is done. A run that would wait, repair or say more is left
// to the day module, which begins anew: nothing has been said, and at most the lock's file made.
bool endsFinishedDay(const DeviceRoot& root) {
  const auto silent = std::make_shared<SilentLog>();
  FileRunLock lock(runLockFolder(root), silent, std::chrono::milliseconds(0));
  const RunTurn turn(lock);
  if (!turn) return false;
  PropertyListPreferences preferences(userPreferencesFolder(root, kProgramUser).value(), silent,
                                      0600, PropertyListPreferences::Access::ReadOnly);
  const DayCheck check = checkDay(preferences, dayOfSeconds(LinuxClock().secondsSince1970()));
  if (!check.isDone() || silent->hasSpoken()) return false;
  const auto log = makeSystemLogOfEnvironment();
  logRunStarted(*log);
  logDayUnchanged(*log, check);
  logRunEnded(*log);
  return true;
}

int runDay(int count, char** arguments) {
  const auto program = programFile();
  const auto function = program ? functionOfModule(*program, kDayModule, kDayFunction)
                                : Result<void*>(program.error());
  if (!function) {
    makeSystemLogOfEnvironment()->message(LogLevel::Error, "nothing is done: {}",
                                          function.error().message);
    constexpr int kCannotLoad = 127;  // as of a program whose libraries are missing
    return kCannotLoad;
  }
  return reinterpret_cast<decltype(&tallyrunRunDay)>(*function)(count, arguments);
}

}  // namespace
}  // namespace tally

int main(int count, char** arguments) {
  using namespace tally;
  surviveFailedWrites();
  const std::string_view mode = count > 1 ? arguments[1] : "";
  if (mode == "--version") {
    // A question about the file, not a run: nothing is opened and nothing is logged.
    std::printf("tallyrun %.*s\n", static_cast<int>(kProgramVersion.size()),
                kProgramVersion.data());
    return std::fflush(stdout) == 0 ? 0 : 1;
  }
  if (mode == "-d" && endsFinishedDay(deviceRootFromEnvironment())) return 0;
  return runDay(count, arguments);
}
