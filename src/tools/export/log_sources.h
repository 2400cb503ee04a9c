// Where the logs of an export come from: the spool, files, standard input.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "tools/export/row_format.h"
#include "tools/frame/tool.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// Hands daily logs to a format, one at a time. What cannot be exported is named on standard error
// and passed over.
class LogSources {
 public:
  // `known` fills in what a log's information does not say; its sequence number is that of the
  // first log without one.
  LogSources(const ToolContext& context, LogOrigin known, RowFormat& format)
      : context_(context), known_(std::move(known)), format_(format) {}

  // The submitted daily logs, oldest first. Logs of other kinds are no part of it.
  void addSpool();
  // A file that holds one log, with the information beside it, which may say that it is no daily
  // one; "-" is standard input, which may hold many, each after its information or without.
  void addFile(const std::string& path);
  bool failed() const { return failed_; }

 private:
  void addStandardInput();
  void addBody(std::string_view title, std::string_view body, LogOrigin origin);
  void addLog(std::string_view title, const DailyLog& log, LogOrigin origin);
  void fail(std::string_view title, std::string_view fault);
  bool outputFailed() const;

  const ToolContext& context_;
  LogOrigin known_;
  RowFormat& format_;
  bool failed_ = false;
};

}  // namespace tally::tools
