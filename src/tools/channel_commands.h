// tallyctl channels: the statistics channels that drivers publish.
#pragma once

#include "tools/tool.h"

namespace tally::tools {

void addChannelCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
