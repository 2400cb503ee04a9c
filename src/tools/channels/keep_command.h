// tallyctl channels keep: what the kernel's counters count until now, kept for their day.
#pragma once

#include "tools/frame/command.h"

namespace tally::tools {

void addKeepCommand(CLI::App& channels, ToolContext& context);

}  // namespace tally::tools
