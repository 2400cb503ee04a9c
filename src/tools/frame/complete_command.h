// tallyctl complete: what may follow on a command line, for the completion of shells. Hidden.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

// Prints a candidate a line, each with a tab and what it means; ":file" and ":dir" alone on a line
// ask the shell for files and folders.
void addCompleteCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
