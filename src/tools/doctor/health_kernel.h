// Checks of what the kernel shows: the wear of flash disks, and its statistics source by source.
#pragma once

#include "tools/doctor/health_check.h"
#include "tools/frame/tool.h"

namespace tally::tools {

// No statistics for a device whose description has channels of its own, no disks for one that
// describes its storage driver.
void examineKernelSources(const ToolContext& context, HealthChecks& checks);

}  // namespace tally::tools
