// tallyrun: the daily job. The one place where the platform is built and installed.
#include <malloc.h>

#include <cstdio>
#include <cstring>
#include <span>

#include "base/process.h"
#include "base/version.h"
#include "driver/app_info_listener.h"
#include "driver/daily_job.h"
#include "driver/tasking.h"
#include "driver/telemetry_sweep.h"
#include "host/host_platform.h"
#include "host/system/environment.h"
#include "platform/platform.h"

int main(int count, char** arguments) {
  tally::surviveFailedWrites();
  if (count > 1 && std::strcmp(arguments[1], "--version") == 0) {
    // A question about the file, not a run: nothing is opened and nothing is logged.
    std::printf("tallyrun %.*s\n", static_cast<int>(tally::kProgramVersion.size()),
                tally::kProgramVersion.data());
    return std::fflush(stdout) == 0 ? 0 : 1;
  }
  // A run is short: memory that it gave back to the kernel it would soon ask for again, at the
  // price of a fault for each page.
  constexpr int kKeptBytes = 64 << 20;
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  ::mallopt(M_MMAP_THRESHOLD, kKeptBytes / 2);
  const tally::PlatformScope scope(tally::makeHostPlatform(tally::deviceRootFromEnvironment()));
  tally::AppInfoListener listener;
  tally::DailyJob job({
      .startListener = [&listener](tally::DailyJob& self) { return listener.start(self); },
      .stopListener = [&listener] { return listener.stop(); },
      .runTelemetrySweep = [] { tally::runTelemetrySweep(tally::programSweepCapabilities()); },
      .updateTaskingState = tally::updateTaskingState,
  });
  return job.run({arguments, static_cast<std::size_t>(count)});
}
