// A daily log as rows.
#pragma once

#include <cstddef>
#include <string>

#include "host/spool/log_spool.h"
#include "tools/export/row_format.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// What the log's information says of it: nothing unless it says that the log is a daily one.
LogOrigin originOf(const SpooledLog& log);

// What a log holds that cannot be a row: of a type that no log has there.
struct SkippedValues {
  std::size_t count = 0;
  std::string first;  // what the first one is, for a message
};

// Hands every value of the log to the format: scalars, then distributions, in the log's order.
SkippedValues exportLog(const DailyLog& log, const LogOrigin& origin, RowFormat& format);

}  // namespace tally::tools
