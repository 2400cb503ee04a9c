// Everything that is known about one key on one day.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "report/distribution_summary.h"
#include "report/log_values.h"
#include "tools/metrics/known_metrics.h"
#include "tools/report/daily_log.h"
#include "tools/whitelist/absence.h"
#include "tools/whitelist/whitelist_verdict.h"

namespace tally::tools {

struct ScalarRow {
  std::int32_t day;
  std::int64_t value;
};
struct DistributionRow {
  std::int32_t day;
  DistributionSummary summary;
};

struct KeyStory {
  explicit KeyStory(const ToolContext& context)
      : metrics(knownMetrics(context)),
        judge(*context.platform, loadWhitelistFile(*context.platform)) {}
  KnownMetrics metrics;
  std::string key;
  const Metric* metric = nullptr;  // what is known of it; null: nothing
  std::int32_t day = 0;
  // Every row of the key that the store has, by day.
  std::vector<ScalarRow> scalarRows;
  std::vector<DistributionRow> distributionRows;
  bool measured = false;  // by the report itself, when it is written
  // Of a key that has no rows and is not measured: keys of the store or the whitelist that may have
  // been meant.
  std::vector<std::string> similar;
  WhitelistJudge judge;
  KeyVerdict scalar, distribution;
  // The day's log as it would be made now; null when there would be none.
  KvRef<KvDictionary> next;
  KeyTrace trace;                                 // of the key on its way into that log
  std::optional<SubmittedLogs::Found> submitted;  // the newest log of the day
  bool submissionAllowed = true;
  // What is known of the values of the day, and why none was submitted.
  ValueState scalarValue, distributionValue;
  std::optional<AbsenceReason> unsent;

  // The kinds that the key is of: those that it has rows of or is measured as, both when there are
  // none.
  std::vector<KeyKind> kinds() const;
  // Why a log of the day that is made now does not contain the key as that kind; empty if it does.
  std::optional<AbsenceReason> whyAbsent(KeyKind kind) const;
  // Why the day's submitted log does not; empty if it does, or did as far as can be told.
  std::optional<AbsenceReason> whyNotSubmitted(KeyKind kind) const;
};

KeyStory tellStory(const ToolContext& context, std::string_view key, std::int32_t day);

// The value of the key in a log; null if there is none.
const KvObject* loggedValue(const DailyLog& log, std::string_view key, KeyKind kind);

}  // namespace tally::tools
