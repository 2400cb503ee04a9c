// Checks of the kernel's statistics, source by source.
#pragma once

#include "tools/doctor/health_check.h"
#include "tools/frame/tool.h"

namespace tally::tools {

// Nothing for a device whose description has channels of its own.
void examineKernelSources(const ToolContext& context, HealthChecks& checks);

}  // namespace tally::tools
