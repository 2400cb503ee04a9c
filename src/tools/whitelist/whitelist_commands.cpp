#include "tools/whitelist/whitelist_commands.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <utility>

#include "base/files/file.h"
#include "kv/plist_codec.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/table.h"
#include "tools/metrics/known_metrics.h"
#include "tools/privacy/measure_privacy.h"
#include "tools/privacy/privacy_view.h"
#include "tools/whitelist/absent_command.h"
#include "tools/whitelist/metric_check.h"
#include "tools/whitelist/whitelist_check.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {
namespace {

struct WhitelistArguments {
  std::string file;
  std::vector<std::string> keys;
  bool privacy = false;
  AbsentArguments absent;
};

WhitelistFile load(const ToolContext& context, const WhitelistArguments& arguments) {
  if (arguments.file.empty()) return loadWhitelistFile(*context.platform);
  const auto bytes = readFile(arguments.file, kPlistMaximumBytes);
  if (bytes) return parseWhitelistFile(*bytes);
  WhitelistFile file;
  file.fault = bytes.error().message;
  return file;
}

std::string fileName(const WhitelistArguments& arguments) {
  return arguments.file.empty() ? std::string(kWhitelistPath) : arguments.file;
}

std::string prefixesText(std::size_t count) {
  return count == 1 ? "1 prefix" : fmt::format("{} prefixes", count);
}

class EntryCounter final : public WhitelistVisitor {
 public:
  std::size_t groups = 0, entries[kWhitelistSections] = {};
  bool beginGroup(std::string_view) override { return ++groups > 0; }
  void entry(WhitelistSection section, const WhitelistEntry&) override {
    ++entries[static_cast<std::size_t>(section)];
  }
  void malformed(const WhitelistPlace&) override {}
};

std::size_t countOf(const std::vector<Finding>& findings, Severity severity) {
  return static_cast<std::size_t>(std::ranges::count(findings, severity, &Finding::severity));
}

// What a check read and found.
struct Checked {
  WhitelistFile file;
  const MetricTable& metrics;
  std::vector<Finding> findings;
  std::optional<PrivacyReport> privacy;
};

void printCheckJson(const ToolContext& context, const WhitelistArguments& arguments,
                    const Checked& checked) {
  const auto& [file, metrics, findings, privacy] = checked;
  Json list = Json::array();
  for (const Finding& finding : findings) {
    Json item = {{"severity", finding.severity == Severity::Fault ? "fault" : "surprise"}};
    const std::pair<const char*, const std::string*> levels[] = {{"group", &finding.group},
                                                                 {"section", &finding.section},
                                                                 {"key", &finding.key},
                                                                 {"option", &finding.option}};
    for (const auto& [name, text] : levels) {
      if (!text->empty()) item[name] = *text;
    }
    item["message"] = finding.message;
    list.push_back(std::move(item));
  }
  Json document = {{"file", fileName(arguments)}, {"digest", file.digest}};
  if (!metrics.files().empty()) {
    document["metrics"] = {{"files", metrics.files()},
                           {"keys", metrics.keyCount()},
                           {"prefixes", metrics.prefixCount()}};
  }
  document["faults"] = countOf(findings, Severity::Fault);
  document["surprises"] = countOf(findings, Severity::Surprise);
  document["findings"] = std::move(list);
  if (privacy) document["privacy"] = jsonOf(*privacy);
  printJson(context, document);
}

void printCheck(const ToolContext& context, const WhitelistArguments& arguments,
                const Checked& checked) {
  const auto& [file, metrics, findings, privacy] = checked;
  printLine(context, "Whitelist " + fileName(arguments), Ink::Strong);
  if (file.content) {
    EntryCounter counter;
    visitWhitelist(*file.content, counter);
    const auto& n = counter.entries;
    printLine(context, fmt::format("  {}: scalars {} and {}, distributions {} and {}",
                                   counted(counter.groups, "group"), counted(n[0], "key"),
                                   prefixesText(n[2]), counted(n[1], "key"), prefixesText(n[3])));
  }
  if (!file.digest.empty()) printLine(context, "  digest " + file.digest);
  if (!metrics.files().empty()) {
    printLine(context,
              fmt::format("  metrics: {} and {} in {}", counted(metrics.keyCount(), "key"),
                          prefixesText(metrics.prefixCount()), fmt::join(metrics.files(), ", ")));
  }
  if (!findings.empty()) print(context.out, "\n");
  Table table({{""}, {"", Align::Left, true}});
  for (const Finding& finding : findings) {
    Cell severity = finding.severity == Severity::Fault ? Cell("fault", Ink::Bad)
                                                        : Cell("surprise", Ink::Doubtful);
    if (const std::string place = placeText(finding); !place.empty()) {
      table.add({std::exchange(severity, ""), place});
    }
    table.add({severity, finding.message});
  }
  print(context.out, table.render(context.output, 0));
  const auto faults = countOf(findings, Severity::Fault);
  const auto surprises = countOf(findings, Severity::Surprise);
  print(context.out, "\n");
  printLine(context,
            fmt::format("{}, {}", counted(faults, "fault"), counted(surprises, "surprise")),
            faults > 0 ? Ink::Bad : Ink::Good);
  if (privacy) printPrivacy(context, *privacy);
}

int check(const ToolContext& context, const WhitelistArguments& arguments) {
  std::vector<Finding> ofTables;
  const KnownMetrics metrics(
      MetricTable::load(context.root, [&ofTables](const std::string& message) {
        ofTables.push_back({Severity::Fault, "", "", "", "", message});
      }));
  Checked checked{load(context, arguments), metrics.ofDevice(), {}, {}};
  std::vector<Finding>& findings = checked.findings;
  if (const auto& content = checked.file.content) {
    findings = checkWhitelist(*context.platform, *content);
    std::ranges::move(checkMetrics(context, metrics, *content), std::back_inserter(findings));
  } else {
    findings.push_back({Severity::Fault, "", "", "", "",
                        "the file cannot be used, so nothing is reported: " + checked.file.fault});
  }
  std::ranges::move(ofTables, std::back_inserter(findings));
  if (arguments.privacy && checked.file.content) {
    const WhitelistJudge judge(*context.platform, checked.file);
    checked.privacy = measurePrivacy(context, judge, metrics);
  }
  (context.json ? printCheckJson : printCheck)(context, arguments, checked);
  return countOf(findings, Severity::Fault) > 0 ? kWrong : kSuccess;
}

struct TestedKey {
  std::string key;
  KeyVerdict scalar, distribution;
  bool isReported() const { return scalar.admitted() || distribution.admitted(); }
};

void printTestedKey(const ToolContext& context, const TestedKey& tested) {
  printLine(context, tested.key, Ink::Strong);
  Table table({{""}, {""}, {"", Align::Left, true}});
  for (const KeyVerdict* verdict : {&tested.scalar, &tested.distribution}) {
    std::string text = verdict->reason;
    if (verdict->admitted()) text += "; " + optionsText(*verdict->match.options);
    table.add({std::string("as a ") + std::string(kindName(verdict->kind)),
               verdict->admitted() ? Cell("reported", Ink::Good) : Cell("refused", Ink::Doubtful),
               text});
  }
  table.print(context);
}

int test(const ToolContext& context, const WhitelistArguments& arguments) {
  const WhitelistJudge judge(*context.platform, load(context, arguments));
  std::vector<TestedKey> tested;
  for (const std::string& key : arguments.keys) {
    tested.push_back(
        {key, judge.judge(key, KeyKind::Scalar), judge.judge(key, KeyKind::Distribution)});
  }
  if (context.json) {
    Json document = Json::array();
    for (const auto& [key, scalar, distribution] : tested) {
      document.push_back(
          {{"key", key}, {"scalar", jsonOf(scalar)}, {"distribution", jsonOf(distribution)}});
    }
    printJson(context, document);
  } else {
    for (const TestedKey& one : tested) printTestedKey(context, one);
  }
  return std::ranges::all_of(tested, &TestedKey::isReported) ? kSuccess : kWrong;
}

}  // namespace

void addWhitelistCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<WhitelistArguments> whitelist(
      addFamily(app, "whitelist", "Check the whitelist and test keys against it"), context);
  WhitelistArguments& arguments = whitelist.arguments();
  constexpr const char* kFile = "A whitelist file instead of the device's";

  const Command checking =
      whitelist.add("check", "Find faults (exit status 1) and surprises in the whitelist", check);
  checking.optionalArgument(kFileValue, &arguments.file, kFile);
  checking.flag("--privacy", &arguments.privacy,
                "Measure how much each entry can reveal, by what the store has");

  Command command =
      whitelist.add("test", "Say whether keys would be reported, and by which entry", test);
  command.argument(kStoreKeyValue, &arguments.keys, "Keys of the metrics store");
  command.option("--file", kFileValue, &arguments.file, kFile);

  Command absent = whitelist.add("absent", "List the keys of a day that no log has, and why",
                                 [](const ToolContext& tool, const WhitelistArguments& given) {
                                   return listAbsent(tool, given.absent);
                                 });
  absent.option("--day", kDayValue, &arguments.absent.day, kDayForms);
  absent.flag("--all", &arguments.absent.wholeStore, "Also keys that have values on other days");
}

}  // namespace tally::tools
