// What a command and its options are: the one description that help, man page and completion show.
#pragma once

#include <string>
#include <vector>

#include "host/system/terminal.h"

namespace CLI {
class App;
class Option;
}  // namespace CLI

namespace tally::tools {

struct OptionHelp {
  std::vector<std::string> names;    // "-h", "--help"; an argument without a name has none
  std::string value;                 // "DAY"; empty for a flag
  std::vector<std::string> choices;  // when only these are taken
  std::string description;
  bool required = false, repeats = false;
  bool common = false;  // every command has it
  const CLI::Option* declared = nullptr;
};

struct CommandHelp {
  std::string path;  // "tallyctl store set"
  std::string description;
  std::vector<OptionHelp> arguments;  // in their order
  std::vector<OptionHelp> options;    // its own, then those that every command has
  struct Entry {
    const CLI::App* app;
    std::string name, description;
  };
  std::vector<Entry> commands;
  std::string usage() const;  // "tallyctl store set [OPTION...] KEY VALUE"
};

// "--day DAY", "-h, --help", "KEY".
std::string formOf(const OptionHelp& option);
std::string helpText(const CommandHelp& help, const Terminal& terminal);

}  // namespace tally::tools
