// What the commands of `tallyctl nand` have in common.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

// Adds a command that asks the flash storage's driver. On a device without one it says so and ends;
// run is not called.
CLI::App* addNandCommand(CLI::App& nand, ToolContext& context, const char* name,
                         const char* description, std::function<int()> run);

}  // namespace tally::tools
