// tallyctl recorder: what the recorder holds in memory, and what it refused.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addRecorderCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
