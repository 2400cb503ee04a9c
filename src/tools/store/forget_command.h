// tallyctl forget: erases what the device has recorded about itself.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addForgetCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
