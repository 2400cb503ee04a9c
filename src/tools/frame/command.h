// How a command of tallyctl is declared: help, manual page, completion and docs/commands.md show
// what is declared here.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "tools/frame/tool.h"

namespace tally::tools {

// A value of the command line: its name in the help, and what completion offers for it.
struct Value {
  const char* name;
  ValueKind kind;
};
constexpr Value kStoreKeyValue{"KEY", ValueKind::StoreKey};
constexpr Value kDayValue{"DAY", ValueKind::Day};
constexpr Value kFileValue{"FILE", ValueKind::File};
constexpr Value kTextValue{"TEXT", ValueKind::Text};

// Where a value goes. It outlives the parsing of the command line.
using Target =
    std::variant<std::string*, std::optional<std::string>*, std::vector<std::string>*, double*,
                 std::uint16_t*, std::optional<std::uint32_t>*, std::optional<std::uint64_t>*>;

// A declared option or argument.
class Option {
 public:
  explicit Option(CLI::Option& option) : option_(&option) {}
  const Option& required() const;
  const Option& excludes(const Option& other) const;
  const Option& within(int lowest, int highest) const;
  const Option& within(std::uint64_t lowest, std::uint64_t highest) const;
  const Option& within(double lowest, double highest) const;
  const Option& oneOf(std::vector<std::string> choices) const;
  const Option& showsDefault() const;

 private:
  CLI::Option* option_;
};

// A command that is being declared.
class Command {
 public:
  Command(CLI::App& app, ToolContext& context) : app_(&app), context_(&context) {}

  // Arguments, in their order; a container takes several values.
  Option argument(const Value& value, Target target, const std::string& description) const;
  Option optionalArgument(const Value& value, Target target, const std::string& description) const;
  Option option(const char* name, const Value& value, Target target,
                const std::string& description) const;
  Option flag(const char* name, bool* target, const std::string& description) const;
  // A flag that need not be stored.
  Option flag(const char* name, const std::string& description) const;
  // --play, for a command that reads what a recording may be the source of.
  void canPlay() const;
  // The words of the last argument are another command's line: options and names of commands among
  // them are not ours.
  void endsWithCommandLine() const;
  // Neither help nor completion shows it.
  void hide() const;

 private:
  CLI::App* app_;
  ToolContext* context_;
};

// Adds a command to a family. run is called when the arguments chose the command.
Command addCommand(CLI::App& family, ToolContext& context, const char* name,
                   const char* description, std::function<int()> run);
// Adds a family of commands, one of which must be chosen.
CLI::App& addFamily(CLI::App& app, const char* name, const char* description);

// Commands that fill one set of arguments.
template <class Arguments>
class CommandGroup {
 public:
  using Run = int (*)(const ToolContext& context, const Arguments& arguments);

  CommandGroup(CLI::App& family, ToolContext& context) : family_(family), context_(context) {}
  Command add(const char* name, const char* description, Run run) {
    return addCommand(
        family_, context_, name, description,
        [&context = context_, arguments = arguments_, run] { return run(context, *arguments); });
  }
  Arguments& arguments() { return *arguments_; }

 private:
  CLI::App& family_;
  ToolContext& context_;
  std::shared_ptr<Arguments> arguments_ = std::make_shared<Arguments>();
};

}  // namespace tally::tools
