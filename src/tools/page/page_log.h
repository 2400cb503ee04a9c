// One log as the page shows it: its content, what its numbers stand for, and what stayed behind.
#pragma once

#include <cstdint>
#include <nlohmann/json_fwd.hpp>
#include <optional>
#include <string>
#include <vector>

#include "host/spool/log_spool.h"
#include "tools/metrics/known_metrics.h"
#include "tools/privacy/exposure.h"
#include "tools/report/daily_log.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

// What all logs of a page are explained with, as it is now.
struct PageSources {
  explicit PageSources(const ToolContext& tool);
  const ToolContext& context;
  KnownMetrics metrics;
  WhitelistJudge judge;
  PrivacyReport privacy;
  bool submissionAllowed = true;
};

// A log to show, and the one of an earlier day that it is compared with.
struct PageLog {
  std::optional<DailyLog> content;    // empty when there is none, or when it is damaged
  std::optional<SpooledLog> spooled;  // empty for the log that would go next
  KvRef<KvDictionary> options;        // of the submission; may be null
  std::optional<std::int32_t> day;    // that it reports
  std::optional<DailyLog> before;
  std::vector<std::string> notes;  // what its owner must know first
};

// The log as the page's script reads it: the keys' columns are arrays of equal length, and what
// many keys have in common is in tables.
Json pageBlock(const PageSources& sources, const PageLog& log);

}  // namespace tally::tools
