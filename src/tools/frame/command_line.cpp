#include "tools/frame/command_line.h"

#include <CLI/CLI.hpp>
#include <algorithm>

#include "base/version.h"
#include "tools/frame/command.h"
#include "tools/frame/command_families.h"

namespace tally::tools {
namespace {

// "TYPE:{auto,string}" is a name for people and the accepted values; "S:INT in [0 - 9]"
// only the former.
void readType(OptionHelp& option, const std::string& type) {
  const std::size_t colon = type.find(':');
  option.value = type.substr(0, colon);
  const std::size_t open = type.find('{');
  if (open == std::string::npos || !type.ends_with('}')) return;
  std::string rest = type.substr(open + 1, type.size() - open - 2);
  for (std::size_t begin = 0; begin <= rest.size();) {
    const std::size_t end = std::min(rest.find(',', begin), rest.size());
    option.choices.push_back(rest.substr(begin, end - begin));
    begin = end + 1;
  }
}

OptionHelp describeOption(const CLI::Option& option) {
  OptionHelp help;
  for (const std::string& name : option.get_snames()) help.names.push_back("-" + name);
  for (const std::string& name : option.get_lnames()) help.names.push_back("--" + name);
  if (option.get_items_expected_max() != 0) readType(help, option.get_type_name());
  if (option.get_positional() && help.names.empty()) help.value = option.get_name(true);
  help.description = option.get_description();
  if (!option.get_default_str().empty()) {
    help.description += "; " + option.get_default_str() + " by default";
  }
  help.required = option.get_required();
  help.declared = &option;
  help.repeats = option.get_items_expected_max() > 1;
  return help;
}

const CLI::App& chosenCommand(const CLI::App& app) {
  // Parsed commands are known to their parent; a const app tells them by their count.
  for (const CLI::App* command :
       app.get_subcommands([](const CLI::App* c) { return c->parsed(); })) {
    return chosenCommand(*command);
  }
  return app;
}

ParseFault::Kind kindOf(const CLI::ParseError& error) {
  if (dynamic_cast<const CLI::ArgumentMismatch*>(&error) != nullptr) {
    return ParseFault::Kind::Mismatch;
  }
  if (dynamic_cast<const CLI::RequiredError*>(&error) != nullptr) return ParseFault::Kind::Required;
  if (dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr) return ParseFault::Kind::Extra;
  return ParseFault::Kind::Other;
}

}  // namespace

CommandLine::CommandLine(ToolContext& context) : app_(std::make_unique<CLI::App>()) {
  app_->name("tallyctl");
  app_->description("Inspects a device's analytics: what is stored, what is reported, and why.");
  app_->set_help_flag("-h,--help", "Print this help");
  app_->require_subcommand(1);
  app_->fallthrough();  // the common options are accepted anywhere
  app_->set_version_flag("--version", std::string(kProgramVersion), "Print the version");
  Command common(*app_, context);
  common.option("--root", {"DIR", ValueKind::Directory}, &context.root,
                "The device root; TALLYRUN_ROOT or / by default");
  common.flag("--json", &context.json, "Print JSON");
  for (const CommandFamily addCommands : commandFamilies()) addCommands(*app_, context);
}

CommandLine::~CommandLine() = default;

std::vector<const char*> CommandLine::separated(std::span<const char* const> arguments) const {
  std::vector<const char*> words(arguments.begin(), arguments.end());
  const CLI::App* command = app_.get();
  std::size_t given = 0;  // arguments of the command
  for (std::size_t i = 1; i < words.size(); ++i) {
    const std::string_view word = words[i];
    if (word == "--") break;
    if (word.starts_with('-')) {
      const std::string name(word);
      const CLI::Option* option = command->get_option_no_throw(name);
      if (option == nullptr) option = app_->get_option_no_throw(name);
      if (option != nullptr && option->get_items_expected_max() > 0) ++i;
    } else if (const CLI::App* const next = findCommand(*command, word)) {
      command = next;
    } else if (command->get_prefix_command() && ++given == describe(*command).arguments.size()) {
      words.insert(words.begin() + static_cast<std::ptrdiff_t>(i), "--");
      break;
    }
  }
  return words;
}

CommandLine::Request CommandLine::parse(std::span<const char* const> arguments) {
  try {
    app_->parse(static_cast<int>(arguments.size()), arguments.data());
  } catch (const CLI::CallForHelp&) {
    return Request::Help;
  } catch (const CLI::CallForVersion&) {
    return Request::Version;
  } catch (const CLI::ParseError& error) {
    fault_ = {kindOf(error), error.what(), app_->remaining(true)};
    return Request::Refused;
  }
  return Request::Command;
}

const CLI::App& CommandLine::chosen() const { return chosenCommand(*app_); }

CommandHelp describe(const CLI::App& app) {
  CommandHelp help;
  const CLI::App* root = &app;
  for (help.path = app.get_name(); root->get_parent() != nullptr;) {
    root = root->get_parent();
    help.path = root->get_name() + " " + help.path;
  }
  help.description = app.get_description();
  const auto add = [&help](const CLI::App& owner, bool common) {
    for (const CLI::Option* option : owner.get_options()) {
      const bool isHelp = option == owner.get_help_ptr();
      if (isHelp && !common) continue;  // each command has one of its own
      OptionHelp described = describeOption(*option);
      described.common = common;
      (described.names.empty() ? help.arguments : help.options).push_back(std::move(described));
    }
  };
  if (root != &app) add(app, false);
  add(*root, true);
  for (const CLI::App* command : app.get_subcommands([](const CLI::App*) { return true; })) {
    if (command->get_group().empty()) continue;  // hidden
    help.commands.push_back({command, command->get_name(), command->get_description()});
  }
  return help;
}

const CLI::App* findCommand(const CLI::App& app, std::string_view name) {
  const auto found =
      app.get_subcommands([name](const CLI::App* command) { return command->get_name() == name; });
  return found.empty() ? nullptr : found.front();
}

}  // namespace tally::tools
