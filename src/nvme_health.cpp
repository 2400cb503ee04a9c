// tallyrun-nvme-health: leaves the SMART / health pages of NVMe disks for the daily job.
#include <cstdio>

#include "base/process.h"
#include "host/nvme_health/health_pages.h"

int main() {
  tally::surviveFailedWrites();
  const auto left = tally::leaveHealthPages();
  if (left) return 0;
  std::fprintf(stderr, "%s\n", left.error().message.c_str());
  return 1;
}
