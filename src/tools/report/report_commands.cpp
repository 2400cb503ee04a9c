#include "tools/report/report_commands.h"

#include <memory>
#include <nlohmann/json.hpp>

#include "base/files/file.h"
#include "base/text_lines.h"
#include "base/time_text.h"
#include "base/utf8.h"
#include "kv/plist_codec.h"
#include "platform/platform.h"
#include "report/document.h"
#include "tools/export/export_command.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/standard_input.h"
#include "tools/frame/table.h"
#include "tools/page/page_command.h"
#include "tools/report/daily_log.h"
#include "tools/report/handover_commands.h"
#include "tools/report/log_diff.h"
#include "tools/report/log_view.h"
#include "tools/report/preview.h"

namespace tally::tools {
namespace {

struct ReportArguments {
  std::string day = "yesterday";
  bool diff = false;
  bool xml = false;
  std::string name;
};

std::string timeText(std::optional<double> seconds) {
  std::string text;
  if (seconds) appendTimestamp(text, *seconds);
  return text;
}

Json dayJson(const DailyLog& log) {
  const auto day = log.day();
  return day ? Json(*day) : Json(nullptr);
}

std::string dayDate(const DailyLog& log) {
  const auto day = log.day();
  return day ? dayText(*day) : "-";
}

int previewDiff(const ToolContext& context, const DailyLog& next) {
  const auto last = SubmittedLogs(context).newest();
  const DailyLog empty =
      *DailyLog::of(KvDictionary::create({{"TBCrashLogVersion", KvNumber::int32(1)}}));
  const DailyLog& before = last ? last->content : empty;
  if (context.json) {
    Json json = jsonOfLogDiff(before, next);
    json["before"] = last ? Json({{"file", last->log.fileName}, {"day", dayJson(last->content)}})
                          : Json(nullptr);
    json["after"] = {{"day", dayJson(next)}};
    printJson(context, json);
    return kSuccess;
  }
  printLine(context,
            "Before: " + (last ? fmt::format("{}, {}", last->log.fileName, dayDate(last->content))
                               : std::string("no log was submitted yet")));
  printLine(context, "After:  the next log, " + dayDate(next));
  printLogDiff(context, before, next);
  return kSuccess;
}

int preview(const ToolContext& context, const ReportArguments& arguments) {
  const auto day = dayOf(context, arguments.day);
  if (!day) return kBadUsage;
  const Preview made = previewLog(*context.platform, *day);
  const auto log = DailyLog::of(made.document);
  if (!log) {
    return complain(context,
                    fmt::format("no log would be submitted for {}: the store has no value of that "
                                "day that the whitelist admits",
                                dayName(*day)),
                    kWrong);
  }
  const bool allowed = context.platform->crashReporting->isDiagnosticSubmissionEnabled();
  if (!allowed) {
    print(context.err,
          "tallyctl: submission is not allowed on this device, so the daily job "
          "would not make this log\n");
  }
  if (arguments.diff) return previewDiff(context, *log);
  if (arguments.xml) {
    print(context.out, made.body);  // to be read by a program: not a byte may differ
    return kSuccess;
  }
  if (context.json) {
    Json json = jsonOf(*log, made.options.get(), knownMetrics(context));
    json["submissionAllowed"] = allowed;
    printJson(context, json);
  } else {
    printDailyLog(context, *log, made.options.get(), knownMetrics(context));
  }
  return kSuccess;
}

struct ListedLog {
  SpooledLog log;
  std::optional<DailyLog> content;  // of a daily log that can be read
  std::string_view fault;           // "damaged" and the like; empty when nothing is wrong
};

std::vector<ListedLog> gatherLogs(const SubmittedLogs& logs, const std::vector<SpooledLog>& all) {
  std::vector<ListedLog> listed;
  for (const SpooledLog& log : all) {
    const auto body = logs.read(log);
    auto content = body ? DailyLog::parse(*body) : Result<DailyLog>(body.error());
    if (content) {
      listed.push_back({log, *std::move(content), ""});
    } else {
      listed.push_back({log, std::nullopt, faultOf(log, body)});
    }
  }
  return listed;
}

Json logsJson(const std::vector<ListedLog>& logs) {
  Json document = Json::array();
  for (const auto& [log, content, fault] : logs) {
    document.push_back(
        {{"file", log.fileName},
         {"sequence", log.sequence},
         {"name", log.name},
         {"typeCode", log.typeCode},
         {"bytes", log.bytes},
         {"created", log.creationTime ? Json(timeText(log.creationTime)) : Json(nullptr)},
         {"day", content ? dayJson(*content) : Json(nullptr)},
         {"keys", content ? Json(content->keyCount()) : Json(nullptr)}});
  }
  return document;
}

void printLogs(const ToolContext& context, const std::vector<ListedLog>& logs) {
  if (logs.empty()) return printLine(context, "no log was submitted yet");
  Table table({{"log", Align::Left, true},
               {"type", Align::Right},
               {"day"},
               {"created"},
               {"size", Align::Right},
               {"keys", Align::Right}});
  for (const auto& [log, content, fault] : logs) {
    table.add({log.fileName, log.typeCode,
               !fault.empty() ? Cell(std::string(fault), Ink::Bad)
                              : Cell(content ? dayDate(*content) : "-"),
               timeText(log.creationTime), byteText(log.bytes),
               content ? integerText(static_cast<std::int64_t>(content->keyCount())) : "-"});
  }
  table.print(context);
}

int list(const ToolContext& context, const ReportArguments&) {
  const SubmittedLogs logs(context);
  const auto all = logs.list();
  if (!all) return complain(context, all.error().message, kWrong);
  const auto listed = gatherLogs(logs, *all);
  if (context.json) {
    printJson(context, logsJson(listed));
  } else {
    printLogs(context, listed);
  }
  return kSuccess;
}

// A log of another kind: its lines as they are, made safe to show.
int showText(const ToolContext& context, const std::string& title, std::string_view body) {
  if (context.json) {
    printJson(context, {{"file", title}, {"text", std::string(body)}});
    return kSuccess;
  }
  printLine(context, title, Ink::Strong);
  eachLine(body, [&](std::string_view line) { printLine(context, line); });
  return kSuccess;
}

// Text that begins like a property list is a damaged property list, even if it is readable.
bool isText(std::string_view body) {
  constexpr std::size_t kHead = 1024;
  const bool beginsList =
      body.starts_with("bplist") ||
      (body.starts_with('<') && body.substr(0, kHead).find("<plist") != body.npos);
  return !beginsList && isValidUtf8(body) && body.find('\0') == body.npos;
}

// Structured-data logs are property lists too; they are shown as JSON.
int showPropertyList(const ToolContext& context, const std::string& title, const KvObject& root) {
  const auto* const fields = kvCast<KvDictionary>(&root);
  if (fields == nullptr || !fields->contains("RecordType")) {
    return complain(context, title + " is a property list, but not a daily log", kWrong);
  }
  if (!context.json) printLine(context, title, Ink::Strong);
  printJson(context,
            context.json ? Json{{"file", title}, {"records", jsonOf(&root)}} : jsonOf(&root));
  return kSuccess;
}

int showDailyLog(const ToolContext& context, const std::string& title, std::size_t bytes,
                 const DailyLog& content, const KvDictionary* options) {
  if (context.json) {
    Json json = {{"file", title}, {"bytes", bytes}};
    json.update(jsonOf(content, options, knownMetrics(context)));
    printJson(context, json);
    return kSuccess;
  }
  printDailyLog(context, content, options, knownMetrics(context));
  print(context.out, "\n");
  printLine(context, fmt::format("{}, {}", title, byteText(bytes)), Ink::Faint);
  return kSuccess;
}

// Shows any log, from the spool or from a file (spooled is null then). The content decides how, so
// that a copy is shown like the log itself.
int showBody(const ToolContext& context, const std::string& title, std::string_view body,
             const SpooledLog* spooled) {
  const bool mustBeDaily = spooled != nullptr && isDailyLog(*spooled);
  const auto root = decodePlist(body, kDailyLogMaximumBytes);
  if (!root) {
    if (!mustBeDaily && isText(body)) return showText(context, title, body);
    return complain(context, fmt::format("{} is damaged: {}", title, root.error().message), kWrong);
  }
  const auto content = DailyLog::of(KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get())));
  if (!content) return showPropertyList(context, title, **root);
  return showDailyLog(context, title, body.size(), *content,
                      spooled != nullptr ? spooled->options.get() : nullptr);
}

int showFile(const ToolContext& context, const std::string& path) {
  const bool isStandardInput = path == "-";
  const auto body = isStandardInput ? readStandardInput(kDailyLogMaximumBytes)
                                    : readFile(path, kDailyLogMaximumBytes);
  if (!body) return complain(context, body.error().message, kWrong);
  return showBody(context, isStandardInput ? "standard input" : path, *body, nullptr);
}

int show(const ToolContext& context, const ReportArguments& arguments) {
  const std::string& name = arguments.name;
  if (name == "-" || name.find('/') != std::string::npos) return showFile(context, name);
  const SubmittedLogs logs(context);
  const auto found = logs.find(name);
  const bool isLog = found && *found;
  // The spool's names come first; a file of such a name can be given with its folder.
  if (!isLog && !name.empty() && fileSize(name)) return showFile(context, name);
  if (!found) return complain(context, found.error().message, kWrong);
  if (!isLog) {
    return complain(context,
                    name.empty() ? "no daily log was submitted yet" : "there is no log " + name,
                    kWrong);
  }
  const SpooledLog& log = **found;
  const auto body = logs.read(log);
  if (!body) return complain(context, body.error().message, kWrong);
  return showBody(context, log.fileName, *body, &log);
}

}  // namespace

void addReportCommands(CLI::App& app, ToolContext& context) {
  CLI::App& family = addFamily(app, "report", "Show the next log and earlier ones");
  CommandGroup<ReportArguments> report(family, context);
  ReportArguments& arguments = report.arguments();

  Command command = report.add(
      "preview", "Show the log that would be submitted; changes nothing on the device", preview);
  command.option("--day", kDayValue, &arguments.day, kDayForms);
  const Option diff =
      command.flag("--diff", &arguments.diff, "Only differences from the last submitted log");
  command.flag("--xml", &arguments.xml, "The document itself, byte for byte").excludes(diff);

  report.add("list", "List the submitted logs", list);

  report.add("show", "Show a submitted log: statistics, histograms, scalars", show)
      .optionalArgument(
          {"LOG", ValueKind::Log}, &arguments.name,
          "Its number or name, a file, or - for standard input; the last daily log by default");

  addExportCommand(family, context);
  addHandoverCommands(family, context);
  addPageCommand(family, context);
}

}  // namespace tally::tools
