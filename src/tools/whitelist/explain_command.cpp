#include "tools/whitelist/explain_command.h"

#include <memory>
#include <nlohmann/json.hpp>

#include "base/time_text.h"
#include "host/ingress/recorder_client.h"
#include "platform/platform.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/spelling.h"
#include "tools/frame/table.h"
#include "tools/report/log_view.h"
#include "tools/whitelist/key_story.h"

namespace tally::tools {
namespace {

struct ExplainArguments {
  std::string key;
  std::string day = "yesterday";
};

// What is known of the key, and whether the store contradicts it.
void printMetric(const ToolContext& context, const KeyStory& story) {
  if (story.metric == nullptr) return;
  printLine(context, metricText(*story.metric));
  if (!story.metric->type) return;
  const bool scalar = isScalarType(*story.metric->type);
  if (!(scalar ? story.distributionRows.empty() : story.scalarRows.empty())) {
    printLine(context,
              fmt::format("the store has it as a {}",
                          kindName(scalar ? KeyKind::Distribution : KeyKind::Scalar)),
              Ink::Doubtful);
  }
}

void printRows(const ToolContext& context, const KeyStory& story) {
  printHeading(context, "In the store");
  if (story.scalarRows.empty() && story.distributionRows.empty()) {
    printLine(context, story.measured
                           ? "  no rows: the report measures this key itself when it is written"
                           : "  no rows of this key");
    if (!story.similar.empty()) {
      const std::vector<std::string_view> near(story.similar.begin(), story.similar.end());
      printLine(context, "  did you mean " + alternatives(near) + "?", Ink::Doubtful);
    }
    const auto served = isRecorderServed(DeviceRoot(context.root));
    if (!story.measured && served && *served) {
      printLine(context,
                "  what was recorded since the last commit is not in the store yet: tallyctl "
                "recorder --commit",
                Ink::Faint);
    }
    return;
  }
  const auto dayCell = [&](std::int32_t day) {
    return Cell(dayText(day), day == story.day ? Ink::Strong : Ink::Faint);
  };
  if (!story.scalarRows.empty()) {
    Table table({{"day"}, {"scalar", Align::Right}});
    for (const ScalarRow& row : story.scalarRows) {
      table.add({dayCell(row.day), withUnit(integerText(row.value), story.metric)});
    }
    table.print(context);
  }
  if (!story.distributionRows.empty()) {
    Table table({{"day"},
                 {"samples", Align::Right},
                 {"min", Align::Right},
                 {"mean", Align::Right},
                 {"max", Align::Right}});
    for (const auto& [day, summary] : story.distributionRows) {
      table.add({dayCell(day), integerText(summary.count), realText(summary.minimum),
                 realText(summary.mean), realText(summary.maximum)});
    }
    table.print(context);
  }
}

void printVerdicts(const ToolContext& context, const KeyStory& story) {
  printHeading(context, "In the whitelist");
  if (!story.judge.file().content) return printLine(context, "  there is none", Ink::Doubtful);
  Table table({{""}, {"", Align::Left, true}});
  for (const KeyKind kind : story.kinds()) {
    const KeyVerdict& verdict = kind == KeyKind::Scalar ? story.scalar : story.distribution;
    const bool admitted = verdict.admitted();
    table.add({admitted ? Cell("admitted", Ink::Good) : Cell("refused", Ink::Doubtful),
               fmt::format("as a {}: {}", kindName(verdict.kind), verdict.reason)});
    if (!admitted) continue;
    table.add({"", "options: " + optionsText(*verdict.match.options)});
    for (const KeyCandidate& other : verdict.others) {
      const std::string_view off = whyNotInForce(other.state);
      table.add({"", Cell(fmt::format("passed over: {} {} ({} {})",
                                      isPrefixSection(other.section) ? "prefix" : "entry",
                                      other.entry.key, other.entry.group,
                                      !off.empty() ? off : "has it less specific or earlier"),
                          Ink::Faint)});
    }
  }
  table.print(context);
}

void printRounding(const ToolContext& context, const KeyStory& story) {
  if (!story.trace.scalarBefore) return;
  printHeading(context, "Rounding");
  printLine(context, fmt::format("  {}  {}", story.measured ? "measured now" : "stored",
                                 withUnit(integerText(*story.trace.scalarBefore), story.metric)));
  for (const RoundingStep& step : story.trace.steps) {
    printLine(context, fmt::format("  {} {}: {} becomes {}", step.option, step.setting,
                                   integerText(step.before), integerText(step.after)));
  }
  if (story.trace.steps.empty()) printLine(context, "  no step: the value is reported unchanged");
}

void printValue(const ToolContext& context, const DailyLog& log, const KeyStory& story,
                KeyKind kind) {
  const KvObject* value = loggedValue(log, story.key, kind);
  if (value == nullptr) {
    printLine(context, fmt::format("  absent as a {}", kindName(kind)), Ink::Doubtful);
    return;
  }
  if (kind == KeyKind::Scalar) {
    const auto* number = kvCast<KvNumber>(value);
    printLine(context, "  scalar " + (number != nullptr
                                          ? withUnit(integerText(number->asInt64()), story.metric)
                                          : valueText(value)));
    return;
  }
  if (const auto statistics = statisticsOf(value)) {
    printLine(context, fmt::format("  distribution of {}: min {}, mean {}, std dev {}, max {}",
                                   counted(static_cast<std::uint64_t>(statistics->count), "sample"),
                                   realText(statistics->minimum), realText(statistics->mean),
                                   realText(statistics->standardDeviation()),
                                   withUnit(realText(statistics->maximum), story.metric)));
  } else {
    printLine(context, "  distribution: damaged", Ink::Bad);
  }
  if (const auto* histogram = log.histograms().getAs<KvDictionary>(story.key)) {
    printHistogram(context, *histogram, 4);
  }
}

void printLogs(const ToolContext& context, const KeyStory& story) {
  printHeading(context, fmt::format("In a log of {}, made now", dayText(story.day)));
  const auto next = DailyLog::of(story.next);
  for (const KeyKind kind : story.kinds()) {
    const auto why = story.whyAbsent(kind);
    if (!why && next) {
      printValue(context, *next, story, kind);
    } else {
      printLine(context,
                fmt::format("  absent as a {}: {}", kindName(kind), why ? why->detail : ""),
                Ink::Doubtful);
    }
  }
  if (!story.submissionAllowed) {
    printLine(context, "  the daily job makes no log at all: submission is not allowed",
              Ink::Doubtful);
  }
  if (!story.submitted) {
    printHeading(context, "In the submitted log");
    const bool forbidden =
        story.unsent && story.unsent->absence == Absence::SubmissionForbidden;  // said already
    printLine(context,
              "  no log of that day was submitted" +
                  (story.unsent && !forbidden ? ": " + story.unsent->detail : ""),
              Ink::Doubtful);
    return;
  }
  printHeading(context, "In the submitted log " + story.submitted->log.fileName);
  for (const KeyKind kind : story.kinds()) {
    const DailyLog& log = story.submitted->content;
    const KvObject* submitted = loggedValue(log, story.key, kind);
    const bool same = submitted != nullptr && next &&
                      kvEqual(submitted, loggedValue(*next, story.key, kind)) &&
                      kvEqual(log.histograms().get(story.key), next->histograms().get(story.key));
    if (same && kind == KeyKind::Distribution) {
      printLine(context, "  the same distribution");
    } else {
      printValue(context, log, story, kind);
    }
  }
  const auto* digest = story.submitted->content.document().getAs<KvString>("TBWhitelistDigest");
  if (digest != nullptr && digest->view() != story.judge.file().digest) {
    printLine(context, "  it was made with another whitelist", Ink::Doubtful);
  }
}

Json storyJson(const KeyStory& story) {
  Json scalars = Json::array();
  for (const ScalarRow& row : story.scalarRows) {
    scalars.push_back({{"day", row.day}, {"value", row.value}});
  }
  Json distributions = Json::array();
  for (const auto& [day, summary] : story.distributionRows) {
    distributions.push_back({{"day", day},
                             {"samples", summary.count},
                             {"minimum", jsonOfReal(summary.minimum)},
                             {"mean", jsonOfReal(summary.mean)},
                             {"maximum", jsonOfReal(summary.maximum)}});
  }
  Json json = {{"key", story.key},
               {"day", story.day},
               {"scalarRows", std::move(scalars)},
               {"distributionRows", std::move(distributions)},
               {"measuredByReport", story.measured},
               {"similarKeys", story.similar},
               {"whitelist",
                {{"scalar", jsonOf(story.scalar)}, {"distribution", jsonOf(story.distribution)}}}};
  if (story.metric != nullptr) json["metric"] = jsonOf(*story.metric);
  if (story.trace.scalarBefore) {
    Json steps = Json::array();
    for (const RoundingStep& step : story.trace.steps) {
      steps.push_back({{"option", step.option},
                       {"setting", step.setting},
                       {"before", step.before},
                       {"after", step.after}});
    }
    json["rounding"] = {{"value", *story.trace.scalarBefore}, {"steps", std::move(steps)}};
  }
  const auto logged = [&](const DailyLog& log) {
    return Json{{"scalar", jsonOf(loggedValue(log, story.key, KeyKind::Scalar))},
                {"distribution", jsonOf(loggedValue(log, story.key, KeyKind::Distribution))},
                {"histogram", jsonOf(log.histograms().get(story.key))}};
  };
  const auto next = DailyLog::of(story.next);
  json["nextLog"] = next ? logged(*next) : Json(nullptr);
  for (const KeyKind kind : story.kinds()) {
    const std::string name(kindName(kind));
    if (const auto why = story.whyAbsent(kind)) json["whyAbsent"][name] = why->detail;
    if (const auto why = story.whyNotSubmitted(kind)) {
      json["absence"][name] = rowOf(why->absence).name;
    }
  }
  json["submittedLog"] = nullptr;
  if (story.submitted) {
    json["submittedLog"] = logged(story.submitted->content);
    json["submittedLog"]["file"] = story.submitted->log.fileName;
  }
  return json;
}

int explain(const ToolContext& context, const ExplainArguments& arguments) {
  const auto day = dayOf(context, arguments.day);
  if (!day) return kBadUsage;
  const KeyStory story = tellStory(context, arguments.key, *day);
  bool present = false;
  for (const KeyKind kind : story.kinds()) present = present || !story.whyAbsent(kind);
  if (context.json) {
    printJson(context, storyJson(story));
    return present ? kSuccess : kWrong;
  }
  if (!story.judge.file().content) {
    printLine(context,
              "No whitelist can be used, so nothing is reported: " + story.judge.file().fault,
              Ink::Bad);
  }
  printLine(context, fmt::format("{} on {}", story.key, dayName(story.day)), Ink::Strong);
  printMetric(context, story);
  printRows(context, story);
  printVerdicts(context, story);
  printRounding(context, story);
  printLogs(context, story);
  return present ? kSuccess : kWrong;
}

}  // namespace

void addExplainCommand(CLI::App& app, ToolContext& context) {
  CommandGroup<ExplainArguments> group(app, context);
  ExplainArguments& arguments = group.arguments();
  Command command = group.add("explain", "Follow one key from the store to the log", explain);
  command.argument(kStoreKeyValue, &arguments.key,
                   "A key of the metrics store, or one that the report measures");
  command.option("--day", kDayValue, &arguments.day, kDayForms);
}

}  // namespace tally::tools
