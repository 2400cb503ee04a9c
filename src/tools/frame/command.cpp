#include "tools/frame/command.h"

#include <CLI/CLI.hpp>

namespace tally::tools {

const Option& Option::required() const {
  option_->required();
  return *this;
}
const Option& Option::excludes(const Option& other) const {
  option_->excludes(other.option_);
  return *this;
}
const Option& Option::within(int lowest, int highest) const {
  option_->check(CLI::Range(lowest, highest));
  return *this;
}
const Option& Option::within(std::uint64_t lowest, std::uint64_t highest) const {
  option_->check(CLI::Range(lowest, highest));
  return *this;
}
const Option& Option::within(double lowest, double highest) const {
  option_->check(CLI::Range(lowest, highest));
  return *this;
}
const Option& Option::oneOf(std::vector<std::string> choices) const {
  option_->check(CLI::IsMember(std::move(choices)));
  return *this;
}
const Option& Option::showsDefault() const {
  option_->capture_default_str();
  return *this;
}

Option Command::argument(const Value& value, Target target, const std::string& description) const {
  return optionalArgument(value, target, description).required();
}

Option Command::optionalArgument(const Value& value, Target target,
                                 const std::string& description) const {
  const auto add = [&](auto* variable) {
    return app_->add_option(value.name, *variable, description);
  };
  CLI::Option& added = *std::visit(add, target);
  context_->valueKinds[&added] = value.kind;
  return Option(added);
}

Option Command::option(const char* name, const Value& value, Target target,
                       const std::string& description) const {
  const auto add = [&](auto* variable) { return app_->add_option(name, *variable, description); };
  CLI::Option& added = *std::visit(add, target);
  added.type_name(value.name);
  context_->valueKinds[&added] = value.kind;
  return Option(added);
}

Option Command::flag(const char* name, bool* target, const std::string& description) const {
  return Option(*app_->add_flag(name, *target, description));
}

Option Command::flag(const char* name, const std::string& description) const {
  return Option(*app_->add_flag(name, description));
}

void Command::canPlay() const {
  flag("--play", &context_->play, "Let the samples of a recording follow the clock");
}

void Command::endsWithCommandLine() const { app_->prefix_command(); }

void Command::hide() const { app_->group(""); }

Command addCommand(CLI::App& family, ToolContext& context, const char* name,
                   const char* description, std::function<int()> run) {
  CLI::App& command = *family.add_subcommand(name, description);
  command.callback([&context, run = std::move(run)] { context.command = run; });
  return {command, context};
}

CLI::App& addFamily(CLI::App& app, const char* name, const char* description) {
  CLI::App& family = *app.add_subcommand(name, description);
  family.require_subcommand(1);
  return family;
}

}  // namespace tally::tools
