#include "tools/frame/usage_error.h"

#include <fmt/core.h>

#include <string_view>
#include <vector>

#include "tools/frame/command_help.h"
#include "tools/frame/spelling.h"

namespace tally::tools {
namespace {

constexpr std::size_t kSuggested = 3;

std::vector<std::string_view> namesOf(const CommandHelp& help) {
  std::vector<std::string_view> names;
  for (const auto& command : help.commands) names.push_back(command.name);
  return names;
}

// The command that the arguments lead to, and the word at which they stop when it needs a further
// one; the word is empty when none is left.
struct Path {
  const CLI::App* command;
  std::string_view stop;
};
Path follow(const CLI::App& app, std::span<const char* const> arguments) {
  Path path{&app, {}};
  for (std::size_t i = 1; i < arguments.size(); ++i) {
    const std::string_view word = arguments[i];
    if (word == "--") break;
    if (word == "--root" || word == "--root=") ++i;
    if (word.starts_with('-')) continue;
    const CLI::App* const next = findCommand(*path.command, word);
    if (next == nullptr) {
      path.stop = word;
      break;
    }
    path.command = next;
  }
  return path;
}

std::string unexpected(const CommandHelp& help, std::string_view word) {
  if (!word.starts_with('-')) return fmt::format("\"{}\" is one argument too many", word);
  std::vector<std::string_view> known;
  for (const OptionHelp& option : help.options) {
    for (const std::string& name : option.names) known.push_back(name);
  }
  const std::string_view name = word.substr(0, word.find('='));
  const auto near = nearestWords(name, known, kSuggested);
  if (near.empty()) {
    return fmt::format("{} has no option {}; after -- words may begin with a dash", help.path,
                       name);
  }
  return fmt::format("{} has no option {}{}", help.path, name, suggestion(near));
}

}  // namespace

std::string usageFault(const CLI::App& app, std::span<const char* const> arguments,
                       const ParseFault& refused) {
  const Path path = follow(app, arguments);
  const CommandHelp help = describe(*path.command);
  std::string fault = refused.text;
  const auto names = namesOf(help);
  const auto& rest = refused.rest;
  const bool unknownOption = !rest.empty() && rest.front().starts_with('-');
  if (refused.kind == ParseFault::Kind::Mismatch) {
    const std::string name = fault.substr(0, fault.find(':'));
    const bool isMissing = fault.ends_with("missing");
    fault = name + (isMissing ? " needs a value" : " is given more than once");
  } else if (path.stop.empty() && unknownOption) {
    fault = unexpected(help, rest.front());
  } else if (!names.empty() && refused.kind == ParseFault::Kind::Required) {
    const auto near = nearestWords(path.stop, names, kSuggested);
    fault = path.stop.empty() ? fmt::format("{} needs a command: ", help.path)
                              : fmt::format("{} has no command \"{}\"", help.path, path.stop);
    if (path.stop.empty()) {
      fault += alternatives(names);
    } else if (near.empty()) {
      fault += ", only " + alternatives(names);
    } else {
      fault += suggestion(near);
    }
  } else if (refused.kind == ParseFault::Kind::Extra) {
    if (!rest.empty()) fault = unexpected(help, rest.front());
  }
  return fmt::format("{} (see {} --help)", fault, help.path);
}

}  // namespace tally::tools
