// tallyctl report: the log that would be submitted, and those that were.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addReportCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
