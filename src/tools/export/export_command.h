// `tallyctl report export`: daily logs as rows, for databases and other programs.
#pragma once

#include "tools/frame/command.h"

namespace tally::tools {

void addExportCommand(CLI::App& report, ToolContext& context);

}  // namespace tally::tools
