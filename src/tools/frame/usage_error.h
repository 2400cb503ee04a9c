// What is wrong with a command line, said so that the next one is right.
#pragma once

#include <span>
#include <string>

namespace CLI {
class App;
class ParseError;
}  // namespace CLI

namespace tally::tools {

// The fault that the app found in the arguments (the first is the program's own name): names words
// that are no command or option, and those that may have been meant.
std::string usageFault(const CLI::App& app, std::span<const char* const> arguments,
                       const CLI::ParseError& error);

}  // namespace tally::tools
