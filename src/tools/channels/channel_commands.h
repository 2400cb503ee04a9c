// tallyctl channels: the statistics channels that drivers publish, and their values.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addChannelCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
