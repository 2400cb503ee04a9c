// tallyrun: the daily job.
#include <malloc.h>

#include <cstdio>
#include <cstring>
#include <span>

#include "base/process.h"
#include "base/version.h"
#include "driver/daily_job.h"
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
  // A run is short: memory that it returned to the kernel would soon be needed again, at the cost
  // of a page fault for each page.
  constexpr int kKeptBytes = 64 << 20;
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
  ::mallopt(M_MMAP_THRESHOLD, kKeptBytes / 2);
  // Installed for the two libraries; everything else is handed it.
  const tally::PlatformScope scope(tally::makeHostPlatform(tally::deviceRootFromEnvironment()));
  return tally::runDailyJob(tally::platform(), {arguments, static_cast<std::size_t>(count)});
}
