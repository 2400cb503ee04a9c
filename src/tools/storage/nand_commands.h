// tallyctl nand: the figures and the health of the flash storage.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addNandCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
