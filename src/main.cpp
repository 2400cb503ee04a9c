// tallyrun: the daily job. The one place where the platform is built and installed.
#include <span>

#include "driver/daily_job.h"
#include "driver/telemetry_sweep.h"
#include "host_platform.h"
#include "platform/linux/linux_platform.h"
#include "platform/platform.h"

int main(int count, char** arguments) {
  const tally::PlatformScope scope(tally::makeHostPlatform(tally::deviceRootFromEnvironment()));
  tally::DailyJob job(
      {.startListener = {},
       .runTelemetrySweep = [] { tally::runTelemetrySweep(tally::programSweepCapabilities()); },
       .updateTaskingState = {}});
  return job.run({arguments, static_cast<std::size_t>(count)});
}
