// tallyctl report page: what leaves the device, as a page for its owner.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addPageCommand(CLI::App& report, ToolContext& context);

}  // namespace tally::tools
