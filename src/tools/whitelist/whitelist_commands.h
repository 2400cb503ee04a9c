// tallyctl whitelist: checks the whitelist and asks it about keys.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addWhitelistCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
