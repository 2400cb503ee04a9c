// What a command and its options are: the one description that help, man page and completion show.
#pragma once

#include <string>
#include <vector>

#include "host/system/terminal.h"

namespace CLI {
class App;
}

namespace tally::tools {

struct OptionHelp {
  std::vector<std::string> names;    // "-h", "--help"; an argument without a name has none
  std::string value;                 // "DAY"; empty for a flag
  std::vector<std::string> choices;  // when only these are taken
  std::string description;
  bool required = false, repeats = false;
  bool common = false;  // every command has it
};

struct CommandHelp {
  std::string path;  // "tallyctl store set"
  std::string description;
  std::vector<OptionHelp> arguments;  // in their order
  std::vector<OptionHelp> options;    // its own, then those that every command has
  std::vector<const CLI::App*> commands;
  std::string usage() const;  // "tallyctl store set [OPTION...] KEY VALUE"
};

CommandHelp describe(const CLI::App& app);
// "--day DAY", "-h, --help", "KEY".
std::string formOf(const OptionHelp& option);
std::string helpText(const CLI::App& app, const Terminal& terminal);
// The command of a parsed line that is furthest from the app: what --help is about.
const CLI::App& chosenCommand(const CLI::App& app);
// The command of this name below the app; null when there is none.
const CLI::App* findCommand(const CLI::App& app, std::string_view name);

}  // namespace tally::tools
