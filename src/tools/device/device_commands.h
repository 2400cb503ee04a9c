// tallyctl device: recordings of devices.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addDeviceCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
