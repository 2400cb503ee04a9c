// tallyctl record: values from scripts and other programs, through the metrics daemon.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addRecordCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
