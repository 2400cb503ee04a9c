// tallyctl tasking: the tasking in force, the scheduled one, and what a change would write.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addTaskingCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
