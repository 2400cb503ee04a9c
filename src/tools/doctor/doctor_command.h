// tallyctl doctor: what of this device the program can reach, and what is missing.
#pragma once

#include "tools/frame/tool.h"

namespace tally::tools {

void addDoctorCommand(CLI::App& app, ToolContext& context);

}  // namespace tally::tools
