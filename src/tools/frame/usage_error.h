// Explains what is wrong with a command line and what may have been meant.
#pragma once

#include <span>
#include <string>

#include "tools/frame/command_line.h"

namespace tally::tools {

// The fault that the parser found in the arguments (the first is the program's own name): names
// words that are not a command or an option, and those that may have been meant.
std::string usageFault(const CLI::App& app, std::span<const char* const> arguments,
                       const ParseFault& refused);

}  // namespace tally::tools
