// tallyctl report take, hooks and pseudonym: how submitted logs leave the device.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addHandoverCommands(CLI::App& report, ToolContext& context);

}  // namespace tally::tools
