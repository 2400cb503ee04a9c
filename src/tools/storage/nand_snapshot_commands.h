// tallyctl nand snapshot: a snapshot buffer as text.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

// Adds the command to `nand`.
void addNandSnapshotCommands(CLI::App& nand, ToolContext& context);

}  // namespace tally::tools
