// tallyctl prefs: reads and writes preferences.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addPrefsCommands(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
