// What the commands of `tallyctl nand` share.
#pragma once

#include "tools/frame/command.h"

namespace tally::tools {

// Adds a command that asks the flash storage's driver. On a device without one it reports that,
// and run is not called.
Command addNandCommand(CLI::App& nand, ToolContext& context, const char* name,
                       const char* description, std::function<int()> run);

bool hasStorageDriver(const ToolContext& context);
int complainOfNoDriver(const ToolContext& context);

}  // namespace tally::tools
