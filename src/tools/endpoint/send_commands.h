// tallyctl send: talks to the program's endpoint as any other peer does.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addSendCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
