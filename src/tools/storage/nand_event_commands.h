// tallyctl nand events: what would be sent to the analytics-event service.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

// Adds the command to `nand`.
void addNandEventCommands(CLI::App& nand, ToolContext& context);

}  // namespace tally::tools
