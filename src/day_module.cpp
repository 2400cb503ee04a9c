#include "day_module.h"

#include <malloc.h>

#include <cstddef>

#include "driver/daily_job.h"
#include "host/host_platform.h"
#include "host/system/environment.h"
#include "platform/platform.h"

__attribute__((visibility("default"))) int tallyrunRunDay(int count, char** arguments) {
  // A run is short: memory that it returned to the kernel would soon be needed again, at the cost
  // of a page fault for each page.
  constexpr int kKeptBytes = 64 << 20;
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  ::mallopt(M_MMAP_THRESHOLD, kKeptBytes / 2);
  // Installed for the two libraries; everything else is handed it.
  const tally::PlatformScope scope(tally::makeHostPlatform(tally::deviceRootFromEnvironment()));
  return tally::runDailyJob(tally::platform(), {arguments, static_cast<std::size_t>(count)});
}
