// The table of all commands.
#pragma once

#include <span>

#include "tools/frame/tool.h"

namespace tally::tools {

// Each subject declares its commands in a function of this form. The app and the context outlive
// the commands.
using CommandFamily = void (*)(CLI::App& app, ToolContext& context);
// In the order of the help.
std::span<const CommandFamily> commandFamilies();

}  // namespace tally::tools
