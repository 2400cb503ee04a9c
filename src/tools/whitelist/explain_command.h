// tallyctl explain: one key from the store through whitelist and rounding to the log.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addExplainCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
