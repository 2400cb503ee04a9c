// Checks of the files below the device root.
#pragma once

#include "tools/doctor/health_check.h"
#include "tools/frame/tool.h"

namespace tally::tools {

// Appends the checks in the order in which a day's run uses what they look at. Changes nothing.
void examineFiles(const ToolContext& context, HealthChecks& checks);

}  // namespace tally::tools
