#include "tools/frame/complete_command.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <limits>
#include <memory>
#include <set>

#include "base/natural_order.h"
#include "base/printable.h"
#include "base/time_text.h"
#include "host/host_platform.h"
#include "host/preferences/property_list_preferences.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/command.h"
#include "tools/frame/command_help.h"
#include "tools/frame/command_line.h"
#include "tools/frame/output.h"
#include "tools/report/daily_log.h"

namespace tally::tools {
namespace {

struct Candidate {
  std::string text, meaning;
};
using Candidates = std::vector<Candidate>;

// What the words before the last one lead to.
struct Line {
  const CLI::App* command;
  CommandHelp help;
  const OptionHelp* pending = nullptr;  // the option whose value comes next
  std::size_t arguments = 0;            // of the command, already given
  bool onlyArguments = false;           // after --
  std::string root, domain;             // the values of --root and --domain
  const ToolContext* context = nullptr;
};

const OptionHelp* findOption(const CommandHelp& help, std::string_view name) {
  const auto found = std::ranges::find_if(help.options, [name](const OptionHelp& option) {
    return std::ranges::find(option.names, name) != option.names.end();
  });
  return found != help.options.end() ? &*found : nullptr;
}

void takeValue(Line& line, const OptionHelp& option, const std::string& value) {
  if (option.names.front() == "--root") line.root = value;
  if (option.names.front() == "--domain") line.domain = value;
}

void takeWord(Line& line, const std::string& word) {
  if (line.pending != nullptr) {
    if (word == "=") return;  // shells that split at it
    takeValue(line, *line.pending, word);
    line.pending = nullptr;
  } else if (word == "--") {
    line.onlyArguments = true;
  } else if (!line.onlyArguments && word.starts_with('-') && word.size() > 1) {
    const std::size_t equals = word.find('=');
    const OptionHelp* const option = findOption(line.help, word.substr(0, equals));
    if (option == nullptr || option->value.empty()) return;
    if (equals == std::string::npos) {
      line.pending = option;
    } else {
      takeValue(line, *option, word.substr(equals + 1));
    }
  } else if (const CLI::App* const next = findCommand(*line.command, word)) {
    line.command = next;
    line.help = describe(*next);
  } else if (++line.arguments >= line.help.arguments.size()) {
    line.onlyArguments = line.onlyArguments || line.command->get_prefix_command();
  }
}

Candidates storeKeys(const Line& line) {
  std::set<std::string, decltype(&naturalLess)> keys(&naturalLess);
  listStoreKeys(
      metricsStoreFile(line.root), [&keys](const StoreKey& key) { keys.emplace(key.key); },
      [](const std::string&) {});
  Candidates found;
  for (const std::string& key : keys) found.push_back({key, ""});
  return found;
}

Candidates days(const Line& line) {
  constexpr std::int64_t kMost = 62;
  Candidates found{{"yesterday", ""}, {"today", ""}};
  std::int64_t first = std::numeric_limits<std::int32_t>::max();
  std::int64_t last = std::numeric_limits<std::int32_t>::min();
  listStoreKeys(
      metricsStoreFile(line.root),
      [&](const StoreKey& key) {
        first = std::min(first, key.firstDay);
        last = std::max(last, key.lastDay);
      },
      [](const std::string&) {});
  for (std::int64_t day = last; day >= first && last - day < kMost; --day) {
    found.push_back({dayText(static_cast<std::int32_t>(day)), fmt::format("day {}", day)});
  }
  return found;
}

PropertyListPreferences preferencesOf(const Line& line) {
  return {*userPreferencesFolder(line.root, kProgramUser), line.context->platform->log, 0600,
          PropertyListPreferences::Access::ReadOnly};
}

Candidates domains(const Line& line) {
  Candidates found;
  if (const auto names = preferencesOf(line).listDomains()) {
    for (const std::string& name : *names) found.push_back({name, ""});
  }
  return found;
}

Candidates preferenceKeys(const Line& line) {
  Candidates found;
  auto preferences = preferencesOf(line);
  const auto entries = preferences.copyDomain(line.domain);
  for (const auto& entry : *entries) found.push_back({std::string(entry.key->view()), ""});
  return found;
}

Candidates logs(const Line& line) {
  ToolContext context;
  context.root = line.root;
  Candidates found;
  if (const auto all = SubmittedLogs(context).list()) {
    for (const SpooledLog& log : *all) {
      found.push_back({log.fileName, byteText(log.bytes)});
    }
  }
  found.push_back({":file", ""});
  return found;
}

Candidates disks(const Line& line) {
  Candidates found;
  const Platform platform = makeHostPlatform(line.root, {line.context->platform->log, true});
  for (const FlashDisk& disk : platform.flashDisks->disks()) {
    found.push_back({disk.name, std::string(diskKindName(disk.kind))});
  }
  return found;
}

Candidates valuesOf(const Line& line, const OptionHelp& option) {
  Candidates found;
  for (const std::string& choice : option.choices) found.push_back({choice, ""});
  if (!found.empty()) return found;
  switch (line.context->valueKinds.at(option.declared)) {
    case ValueKind::Text:
    case ValueKind::Number:
      return {};
    case ValueKind::StoreKey:
      return storeKeys(line);
    case ValueKind::Day:
      return days(line);
    case ValueKind::Domain:
      return domains(line);
    case ValueKind::Preference:
      return preferenceKeys(line);
    case ValueKind::Log:
      return logs(line);
    case ValueKind::Disk:
      return disks(line);
    case ValueKind::File:
      return {{":file", ""}};
    case ValueKind::Directory:
      return {{":dir", ""}};
  }
  return {};
}

Candidates optionsOf(const Line& line) {
  Candidates found;
  for (const OptionHelp& option : line.help.options) {
    found.push_back({option.names.back(), option.description});
  }
  return found;
}

Candidates argumentsOf(const Line& line) {
  Candidates found;
  for (const auto& command : line.help.commands) {
    found.push_back({command.name, command.description});
  }
  const auto& arguments = line.help.arguments;
  if (!found.empty() || arguments.empty()) return found;
  const bool repeats = arguments.back().repeats;
  if (line.arguments >= arguments.size() && !repeats) return {};
  return valuesOf(line, arguments[std::min(line.arguments, arguments.size() - 1)]);
}

int complete(const ToolContext& context, const CLI::App& app,
             const std::vector<std::string>& words) {
  Line line{.command = &app,
            .help = describe(app),
            .root = context.root,
            .domain = std::string(kProgramDomain),
            .context = &context};
  for (std::size_t i = 0; i + 1 < words.size(); ++i) takeWord(line, words[i]);
  std::string begun = words.empty() ? "" : words.back(), before;
  if (const std::size_t equals = begun.find('=');
      line.pending == nullptr && begun.starts_with("--") && equals != std::string::npos) {
    line.pending = findOption(line.help, begun.substr(0, equals));
    before = begun.substr(0, equals + 1);
    begun.erase(0, equals + 1);
  } else if (line.pending != nullptr && begun == "=") {
    begun.clear();
  }
  const bool isOption = begun.starts_with('-') && !line.onlyArguments;
  const Candidates found = line.pending != nullptr ? valuesOf(line, *line.pending)
                           : isOption              ? optionsOf(line)
                                                   : argumentsOf(line);
  for (const auto& [text, meaning] : found) {
    const bool fits = text.starts_with(':') || text.starts_with(begun);
    // What cannot be shown as it is cannot be typed either.
    if (!fits || printable(text) != text) continue;
    print(context.out, (text.starts_with(':') ? text : before + text) + "\t" + meaning + "\n");
  }
  return kSuccess;
}

}  // namespace

void addCompleteCommand(CLI::App& app, ToolContext& context) {
  const auto words = std::make_shared<std::vector<std::string>>();
  Command command =
      addCommand(app, context, "complete", "What may follow the words of a command line",
                 [&context, &app, words] { return complete(context, app, *words); });
  command.hide();
  command.optionalArgument({"WORD", ValueKind::Text}, words.get(),
                           "The words after the program, after --; the last is begun");
}

}  // namespace tally::tools
