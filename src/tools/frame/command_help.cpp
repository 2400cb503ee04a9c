#include "tools/frame/command_help.h"

#include <CLI/CLI.hpp>
#include <algorithm>

#include "base/printable.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

// "TYPE:{auto,string}" is a name for people and what may stand in its place; "S:INT in [0 - 9]"
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
  help.repeats = option.get_items_expected_max() > 1;
  return help;
}

void addRows(Table& table, const std::vector<OptionHelp>& options, bool common) {
  for (const OptionHelp& option : options) {
    if (option.common == common) table.add({formOf(option), option.description});
  }
}

void appendTable(std::string& out, const char* title, const Table& table,
                 const Terminal& terminal) {
  if (!table.empty()) out += std::string("\n") + title + ":\n" + table.render(terminal);
}

Table emptyTable() { return Table({{""}, {"", Align::Left, true}}); }

std::string wrappedText(const std::string& text, const Terminal& terminal) {
  std::string out;
  for (const std::string& line : wrapped(text, terminal.columns)) out += line + "\n";
  return out;
}

}  // namespace

std::string formOf(const OptionHelp& option) {
  std::string form;
  for (const std::string& name : option.names) form += (form.empty() ? "" : ", ") + name;
  if (option.value.empty()) return form;
  form += (form.empty() ? "" : " ") + option.value;
  return option.repeats ? form + "..." : form;
}

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
  help.commands = app.get_subcommands([](const CLI::App* command) {
    return !command->get_group().empty();  // those without a group are hidden
  });
  return help;
}

std::string CommandHelp::usage() const {
  std::string text = path;
  if (!commands.empty()) return text + " COMMAND [ARGUMENT...] [OPTION...]";
  for (const OptionHelp& argument : arguments) {
    const std::string form = formOf(argument);
    text += argument.required ? " " + form : " [" + form + "]";
  }
  return text + " [OPTION...]";
}

std::string helpText(const CLI::App& app, const Terminal& terminal) {
  const CommandHelp help = describe(app);
  Terminal shown = terminal;
  shown.interactive = true;  // wrapped in a file too
  std::string out = wrappedText(help.description + ".", shown);
  if (out.ends_with("..\n")) out.erase(out.size() - 2, 1);
  out += "\n" + wrappedText("Usage: " + help.usage(), shown);
  Table commands = emptyTable(), arguments = emptyTable(), options = emptyTable(),
        common = emptyTable();
  for (const CLI::App* command : help.commands) {
    commands.add({command->get_name(), command->get_description()});
  }
  addRows(arguments, help.arguments, false);
  addRows(options, help.options, false);
  addRows(common, help.options, true);
  appendTable(out, "Commands", commands, shown);
  appendTable(out, "Arguments", arguments, shown);
  appendTable(out, "Options", options, shown);
  appendTable(out, "Options of every command", common, shown);
  return out + "\n" +
         wrappedText(
             "Exit status: 0 success, 1 what was asked about is wrong or missing, 2 bad usage.",
             shown);
}

const CLI::App& chosenCommand(const CLI::App& app) {
  // Parsed commands are known to their parent; a const app tells them by their count.
  for (const CLI::App* command :
       app.get_subcommands([](const CLI::App* c) { return c->parsed(); })) {
    return chosenCommand(*command);
  }
  return app;
}

const CLI::App* findCommand(const CLI::App& app, std::string_view name) {
  const auto found =
      app.get_subcommands([name](const CLI::App* command) { return command->get_name() == name; });
  return found.empty() ? nullptr : found.front();
}

}  // namespace tally::tools
