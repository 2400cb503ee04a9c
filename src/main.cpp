// tallyrun: the daily job. The one place where the platform is built and installed.
#include <malloc.h>

#include <span>

#include "base/process.h"
#include "driver/app_info_listener.h"
#include "driver/daily_job.h"
#include "driver/tasking.h"
#include "driver/telemetry_sweep.h"
#include "host_platform.h"
#include "platform/linux/linux_platform.h"
#include "platform/platform.h"

int main(int count, char** arguments) {
  tally::surviveFailedWrites();
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
