// tallyctl nand: the lists that the storage driver keeps, and the weekly storage log.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

// Adds them to the family `nand`.
void addNandListCommands(CLI::App& nand, ToolContext& context);

}  // namespace tally::tools
