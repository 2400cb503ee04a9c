// Writes a manual page from a template: the lines @OPTIONS@ and @COMMANDS@ become what the commands
// of tallyctl declare, @ENTRIES@ the entries of the device description, @WHITELIST_OPTIONS@ the
// options of the whitelist, @RECORDER_SETTINGS@ the settings of the recorder, and @REFUSALS@ what
// it counts. Runs when the project is built, and is not installed.
#include <cstdio>
#include <fstream>
#include <iostream>
#include <string>

#include "config/whitelist_options.h"
#include "host/described/described_entries.h"
#include "platform/tables/recorder_settings.h"
#include "recorder/refusal.h"
#include "tools/frame/command_help.h"
#include "tools/frame/command_line.h"
#include "tools/frame/output.h"
#include "tools/frame/tool.h"

namespace {

using tally::tools::CommandHelp;
using tally::tools::OptionHelp;

// Text as roff has it: no minus that could become a hyphen, no escape, no request.
std::string roff(const std::string& text) {
  std::string out;
  for (const char c : text) {
    if (c == '-') {
      out += "\\-";
    } else if (c == '\\') {
      out += "\\e";
    } else if (out.empty() && (c == '.' || c == '\'')) {
      out += std::string("\\&") + c;
    } else {
      out += c;
    }
  }
  return out;
}

std::string sentence(std::string text) {
  if (!text.empty() && text[0] >= 'a' && text[0] <= 'z') text[0] = static_cast<char>(text[0] - 32);
  return text.empty() || text.ends_with('.') ? text : text + ".";
}

void writeOption(std::ostream& out, const OptionHelp& option) {
  std::string names;
  for (const std::string& name : option.names) {
    names += (names.empty() ? "\\fB" : ", \\fB") + roff(name) + "\\fR";
  }
  if (!option.value.empty()) {
    names += (names.empty() ? "\\fI" : " \\fI") + roff(option.value) + "\\fR";
    if (option.repeats) names += " ...";
  }
  out << ".TP\n" << names << '\n' << roff(sentence(option.description)) << '\n';
}

void writeCommand(std::ostream& out, const CommandHelp& help, bool isTop) {
  if (isTop) out << ".SS " << roff(help.path.substr(help.path.rfind(' ') + 1)) << '\n';
  if (!help.commands.empty()) {
    out << roff(sentence(help.description)) << '\n';
    for (const auto& command : help.commands) {
      writeCommand(out, tally::tools::describe(*command.app), false);
    }
    return;
  }
  out << ".TP\n\\fB" << roff(help.path) << "\\fR";
  for (const OptionHelp& argument : help.arguments) {
    const std::string form =
        "\\fI" + roff(argument.value) + "\\fR" + (argument.repeats ? " ..." : "");
    out << (argument.required ? " " + form : " [" + form + "]");
  }
  for (const OptionHelp& option : help.options) {
    if (option.common) continue;
    const std::string value = option.value.empty() ? "" : " \\fI" + roff(option.value) + "\\fR";
    const std::string form = "\\fB" + roff(option.names.back()) + "\\fR" + value;
    out << (option.required ? " " + form : " [" + form + "]");
  }
  out << '\n' << roff(sentence(help.description)) << '\n';
  const bool hasOwn = !help.arguments.empty() || !help.options.front().common;
  if (!hasOwn) return;  // checkers of manual pages complain about an empty block
  out << ".RS\n";
  for (const OptionHelp& argument : help.arguments) writeOption(out, argument);
  for (const OptionHelp& option : help.options) {
    if (!option.common) writeOption(out, option);
  }
  out << ".RE\n";
}

// A row of a table: its name, what kind of value it has, and its meaning.
void writeEntry(std::ostream& out, std::string_view name, const std::string& kind,
                std::string meaning) {
  std::erase(meaning, '`');
  out << ".TP\n\\fB" << roff(std::string(name)) << "\\fR" << (kind.empty() ? "" : " (" + kind + ")")
      << '\n'
      << roff(sentence(std::move(meaning))) << '\n';
}

void writeRecorderSettings(std::ostream& out) {
  for (const tally::RecorderNumberRow& row : tally::kRecorderNumbers) {
    writeEntry(out, row.name,
               "integer, " + std::to_string(row.least) + " to " + std::to_string(row.most) + "; " +
                   std::to_string(row.fallback) + " if unset",
               std::string(row.meaning));
  }
  for (const tally::RecorderTextRow& row : tally::kRecorderTexts) {
    writeEntry(out, row.name, std::string(row.form), std::string(row.meaning));
  }
}

void writeRefusals(std::ostream& out) {
  for (const tally::RefusalRow& row : tally::kRefusals) {
    writeEntry(out, row.key, "", std::string(row.meaning));
  }
  for (const tally::RefusalRow& row : tally::kRecorderCounts) {
    writeEntry(out, row.key, "", std::string(row.meaning));
  }
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 3) {
    std::cerr << "usage: manual TEMPLATE PAGE\n";
    return 2;
  }
  tally::tools::ToolContext context;
  const tally::tools::CommandLine line(context);
  const CommandHelp help = tally::tools::describe(line.app());
  std::ifstream in(arguments[1]);
  std::ofstream out(arguments[2]);
  for (std::string text; std::getline(in, text);) {
    if (text == "@OPTIONS@") {
      for (const OptionHelp& option : help.options) writeOption(out, option);
    } else if (text == "@COMMANDS@") {
      for (const auto& command : help.commands) {
        writeCommand(out, tally::tools::describe(*command.app), true);
      }
    } else if (text == "@ENTRIES@") {
      for (const tally::DescribedEntry& entry : tally::kDescribedEntries) {
        writeEntry(out, entry.name, std::string(tally::tools::typeName(entry.type)),
                   std::string(entry.answers));
      }
    } else if (text == "@WHITELIST_OPTIONS@") {
      for (const tally::WhitelistOption& option : tally::whitelistOptions()) {
        const bool isNumber = option.value == tally::OptionValue::WholeNumber;
        std::string meaning = std::string(isNumber ? "A whole number: " : "An array of numbers: ");
        meaning += option.meaning;
        writeEntry(out, option.name, "", std::move(meaning));
      }
    } else if (text == "@RECORDER_SETTINGS@") {
      writeRecorderSettings(out);
    } else if (text == "@REFUSALS@") {
      writeRefusals(out);
    } else {
      out << text << '\n';
    }
  }
  out.close();
  return in.eof() && out ? 0 : 1;
}
