#include "tools/key_story.h"

#include <algorithm>
#include <limits>

#include "platform/platform.h"
#include "tools/preview.h"

namespace tally::tools {
namespace {

constexpr std::int32_t kBeforeAllDays = std::numeric_limits<std::int32_t>::min();
constexpr std::int32_t kLastDay = std::numeric_limits<std::int32_t>::max();

void readRows(KeyStory& story) {
  const auto history = platform().metricsStore->openHistory();
  history->enumerateScalars(story.key, kBeforeAllDays, kLastDay,
                            [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
                              if (key == story.key) story.scalarRows.push_back({day, value});
                            });
  const auto noOptions = ScalarOptions::create();
  history->enumerateDistributions(
      story.key, kBeforeAllDays, kLastDay,
      [&](std::string_view key, std::int32_t day, DistributionValues& values, bool&) {
        if (key != story.key) return;
        story.distributionRows.push_back(
            {day, summariseDistribution(values, key, *noOptions).summary});
      });
}

template <class Rows>
bool hasDay(const Rows& rows, std::int32_t day) {
  return std::ranges::any_of(rows, [day](const auto& row) { return row.day == day; });
}

}  // namespace

std::string KeyStory::whyAbsent(KeyKind kind) const {
  const bool isScalar = kind == KeyKind::Scalar;
  const KeyVerdict& verdict = isScalar ? scalar : distribution;
  const bool stored = isScalar ? hasDay(scalarRows, day) : hasDay(distributionRows, day);
  const bool mine = isScalar && measured;
  if (!stored && !mine) return "the store has no such row on that day";
  if (!verdict.admitted()) return "the whitelist refuses it";
  if (!next) {
    return "the day has no whitelisted value in the store, so no log is made and nothing is "
           "measured";
  }
  if (mine && !trace.scalarBefore) {
    return "it cannot be measured: a count that it needs cannot be read, or is 0";
  }
  return "";
}

KeyStory tellStory(const ToolContext& context, std::string_view key, std::int32_t day) {
  KeyStory story(loadWhitelistFile());
  story.key = key;
  story.day = day;
  story.measured = isMeasuredByReport(key);
  story.scalar = story.judge.judge(key, KeyKind::Scalar);
  story.distribution = story.judge.judge(key, KeyKind::Distribution);
  readRows(story);
  story.trace.key = key;
  story.next = previewLog(day, &story.trace).document;
  story.submitted = SubmittedLogs(context).newest(day);
  story.submissionAllowed = platform().crashReporting->isDiagnosticSubmissionEnabled();
  return story;
}

const KvObject* loggedValue(const DailyLog& log, std::string_view key, KeyKind kind) {
  return (kind == KeyKind::Scalar ? log.scalars() : log.distributions()).get(key);
}

}  // namespace tally::tools
