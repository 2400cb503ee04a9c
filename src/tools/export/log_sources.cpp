#include "tools/export/log_sources.h"

#include <fmt/core.h>

#include <cerrno>

#include "base/files/file.h"
#include "report/document.h"
#include "tools/export/exported_log.h"
#include "tools/export/log_stream.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

// Which log it is, as far as its information says.
enum class LogKind { Unknown, Daily, Other };

LogKind kindOf(const SpooledLog& log) {
  if (isDailyLog(log)) return LogKind::Daily;
  // A program may submit logs of its own name without a type code.
  const bool isDamaged = log.name.empty() || (log.name == kDailyLogName && log.typeCode.empty());
  return isDamaged ? LogKind::Unknown : LogKind::Other;
}

bool isNamedDaily(const SpooledLog& log) {
  return log.fileName.ends_with(fmt::format("-{}{}", kDailyLogName, kBodySuffix));
}

void fillIn(std::string& text, const std::string& known) {
  if (text.empty()) text = known;
}

}  // namespace

void LogSources::fail(std::string_view title, std::string_view fault) {
  complain(context_, fmt::format("{}: {}", title, fault), kWrong);
  failed_ = true;
}

bool LogSources::outputFailed() const { return std::ferror(context_.out) != 0; }

void LogSources::addBody(std::string_view title, std::string_view body, LogOrigin origin) {
  const auto log = DailyLog::parse(body);
  if (!log) return fail(title, log.error().message);
  addLog(title, *log, std::move(origin));
}

void LogSources::addLog(std::string_view title, const DailyLog& log, LogOrigin origin) {
  fillIn(origin.device, known_.device);
  fillIn(origin.systemVersion, known_.systemVersion);
  fillIn(origin.configuration, known_.configuration);
  if (!origin.sequence) origin.sequence = std::exchange(known_.sequence, std::nullopt);
  const SkippedValues skipped = exportLog(log, origin, format_);
  if (skipped.count != 0) {
    fail(title,
         fmt::format("{} skipped, the first: {}", counted(skipped.count, "value"), skipped.first));
  }
}

void LogSources::addSpool() {
  const SubmittedLogs logs(context_);
  const auto all = logs.list();
  if (!all) return fail("spool", all.error().message);
  for (const SpooledLog& log : *all) {
    if (outputFailed()) return;
    const LogKind kind = kindOf(log);
    if (kind == LogKind::Other || (kind == LogKind::Unknown && !isNamedDaily(log))) continue;
    const auto body = logs.read(log);
    if (!body) {
      fail(log.fileName, body.error().message);
      continue;
    }
    addBody(log.fileName, *body, originOf(log));
    if (kind == LogKind::Unknown) fail(log.fileName, "its information is missing or damaged");
  }
}

void LogSources::addFile(const std::string& path) {
  if (outputFailed()) return;
  if (path == "-") return addStandardInput();
  SpooledLog log;
  if (path.ends_with(kBodySuffix)) {
    const std::string stem = path.substr(0, path.size() - kBodySuffix.size());
    const std::string beside = stem + std::string(kInformationSuffix);
    const auto information = readFile(beside, kLargestInformation);
    if (information) readLogInformation(*information, log);
    const LogKind kind = kindOf(log);
    if (kind == LogKind::Other) return;
    const bool isBare = !information && information.error().systemError == ENOENT;
    if (!isBare && kind == LogKind::Unknown) {
      fail(beside, information ? "not the information of a log" : information.error().message);
    }
  }
  const auto body = readFile(path, kDailyLogMaximumBytes);
  if (!body) {
    complain(context_, body.error().message, kWrong);
    failed_ = true;
    return;
  }
  addBody(path, *body, originOf(log));
}

void LogSources::addStandardInput() {
  LogStream stream(stdin, kDailyLogMaximumBytes);
  SpooledLog next;  // what information came before the log
  for (std::size_t number = 1; !outputFailed(); ++number) {
    const auto document = stream.next();
    if (!document) return;
    const std::string title = fmt::format("standard input, document {}", number);
    if (!*document) {
      fail(title, document->error().message);
      next = SpooledLog();
      continue;
    }
    const SpooledLog information = std::exchange(next, {});
    const auto log = DailyLog::parse(**document);
    if (log) {
      addLog(title, *log, originOf(information));
      continue;
    }
    if ((*document)->size() <= kLargestInformation) readLogInformation(**document, next);
    const bool isOther = kindOf(information) == LogKind::Other;
    if (kindOf(next) == LogKind::Unknown && !isOther) fail(title, log.error().message);
  }
}

}  // namespace tally::tools
