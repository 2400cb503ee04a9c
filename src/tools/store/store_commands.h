// tallyctl store: writes and reads the metrics store.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addStoreCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
