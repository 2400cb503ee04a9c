// tallyctl doctor: which parts of this device respond, and what is missing.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addDoctorCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
