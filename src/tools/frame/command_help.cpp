#include "tools/frame/command_help.h"

#include "base/printable.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

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

std::string CommandHelp::usage() const {
  std::string text = path;
  if (!commands.empty()) return text + " COMMAND [ARGUMENT...] [OPTION...]";
  for (const OptionHelp& argument : arguments) {
    const std::string form = formOf(argument);
    text += argument.required ? " " + form : " [" + form + "]";
  }
  return text + " [OPTION...]";
}

std::string helpText(const CommandHelp& help, const Terminal& terminal) {
  Terminal shown = terminal;
  shown.interactive = true;  // wrapped in a file too
  std::string out = wrappedText(help.description + ".", shown);
  if (out.ends_with("..\n")) out.erase(out.size() - 2, 1);
  out += "\n" + wrappedText("Usage: " + help.usage(), shown);
  Table commands = emptyTable(), arguments = emptyTable(), options = emptyTable(),
        common = emptyTable();
  for (const auto& [app, name, description] : help.commands) commands.add({name, description});
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

}  // namespace tally::tools
