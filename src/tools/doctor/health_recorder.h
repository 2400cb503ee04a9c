// Checks of the recorder, which takes the metrics of other programs.
#pragma once

#include "tools/doctor/health_check.h"
#include "tools/frame/tool.h"

namespace tally::tools {

// A device without one gets a single line, unless its settings are faulty. Where systemd holds the
// sockets, asking starts the recorder.
void examineRecorder(const ToolContext& context, HealthChecks& checks);

}  // namespace tally::tools
