#include "tools/whitelist/key_story.h"

#include <algorithm>
#include <iterator>
#include <limits>
#include <set>

#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "platform/platform.h"
#include "report/device_metrics.h"
#include "tools/frame/spelling.h"
#include "tools/report/preview.h"
#include "tools/whitelist/day_account.h"
#include "tools/whitelist/refused_keys.h"

namespace tally::tools {
namespace {

constexpr std::int32_t kBeforeAllDays = std::numeric_limits<std::int32_t>::min();
constexpr std::int32_t kLastDay = std::numeric_limits<std::int32_t>::max();

void readRows(const ToolContext& context, KeyStory& story) {
  ValueState* reading = &story.scalarValue;
  const auto history = openSqliteHistory(
      metricsStoreFile(context.root),
      [&](const std::string& message) {
        context.platform->log->fault("metrics store", "{}", message);
        reading->storeFails = !reading->damaged;
      },
      [&](std::string_view key, std::int64_t day) {
        if (key == story.key && day == story.day) reading->damaged = true;
      });
  history->enumerateScalars(story.key, kBeforeAllDays, kLastDay,
                            [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
                              if (key == story.key) story.scalarRows.push_back({day, value});
                            });
  reading = &story.distributionValue;
  const auto noOptions = ScalarOptions::create();
  history->enumerateDistributions(
      story.key, kBeforeAllDays, kLastDay,
      [&](std::string_view key, std::int32_t day, DistributionValues& values, bool&) {
        if (key != story.key) return;
        story.distributionRows.push_back(
            {day, summariseDistribution(*context.platform->log, values, key, *noOptions).summary});
      });
}

class KeyCollector final : public WhitelistVisitor {
 public:
  explicit KeyCollector(std::set<std::string, std::less<>>& keys) : keys_(keys) {}
  bool beginGroup(std::string_view) override { return true; }
  void entry(WhitelistSection section, const WhitelistEntry& found) override {
    if (!isPrefixSection(section)) keys_.emplace(found.key);
  }
  void malformed(const WhitelistPlace&) override {}

 private:
  std::set<std::string, std::less<>>& keys_;
};

std::vector<std::string> similarKeys(const ToolContext& context, const KeyStory& story) {
  constexpr std::size_t kSuggested = 3;
  std::set<std::string, std::less<>> keys;
  listStoreKeys(
      metricsStoreFile(context.root), [&keys](const StoreKey& key) { keys.emplace(key.key); },
      [](const std::string&) {});
  KeyCollector collector(keys);
  if (const auto& whitelist = story.judge.file().content) visitWhitelist(*whitelist, collector);
  const std::vector<std::string_view> known(keys.begin(), keys.end());
  auto near = nearestWords(story.key, known, kSuggested);
  if (near.empty() && !story.key.empty()) {
    // Not a slip: perhaps a part of the name.
    std::ranges::copy_if(known, std::back_inserter(near), [&story](std::string_view key) {
      return key.find(story.key) != std::string_view::npos;
    });
    if (near.size() > kSuggested) near.resize(kSuggested);
  }
  return {near.begin(), near.end()};
}

template <class Rows>
bool hasDay(const Rows& rows, std::int32_t day) {
  return std::ranges::any_of(rows, [day](const auto& row) { return row.day == day; });
}

// After everything else is known.
void completeValues(const ToolContext& context, KeyStory& story) {
  story.scalarValue.stored = hasDay(story.scalarRows, story.day);
  story.scalarValue.elsewhen = !story.scalarRows.empty();
  story.scalarValue.measured = story.measured;
  story.scalarValue.logMade = static_cast<bool>(story.next);
  story.scalarValue.measurable = story.trace.scalarBefore.has_value();
  story.distributionValue.stored = hasDay(story.distributionRows, story.day);
  story.distributionValue.elsewhen = !story.distributionRows.empty();
  if (story.scalarValue.stored && story.distributionValue.stored) return;
  for (const RefusedKey& refused : refusedKeys(DeviceRoot(context.root), story.day)) {
    if (refused.key != story.key) continue;
    if (refused.kind != KeyKind::Distribution) story.scalarValue.refusal = refused.meaning;
    if (refused.kind != KeyKind::Scalar) story.distributionValue.refusal = refused.meaning;
  }
}

}  // namespace

std::vector<KeyKind> KeyStory::kinds() const {
  const bool isScalar = measured || !scalarRows.empty();
  const bool isDistribution = !distributionRows.empty();
  std::vector<KeyKind> kinds;
  if (isScalar || !isDistribution) kinds.push_back(KeyKind::Scalar);
  if (isDistribution || !isScalar) kinds.push_back(KeyKind::Distribution);
  return kinds;
}

std::optional<AbsenceReason> KeyStory::whyAbsent(KeyKind kind) const {
  const bool isScalar = kind == KeyKind::Scalar;
  const KeyVerdict& verdict = isScalar ? scalar : distribution;
  const ValueState& value = isScalar ? scalarValue : distributionValue;
  if (auto why = whyNoValue(value)) return why;
  if (verdict.absence) {
    return AbsenceReason{*verdict.absence, "the whitelist refuses it: " + verdict.reason};
  }
  return whyNotMeasured(value);
}

std::optional<AbsenceReason> KeyStory::whyNotSubmitted(KeyKind kind) const {
  const auto now = whyAbsent(kind);
  if (!submitted) return now ? now : unsent;
  if (loggedValue(submitted->content, key, kind) != nullptr) return std::nullopt;
  return whyAbsentFrom(submitted->content, now, judge.file().digest);
}

KeyStory tellStory(const ToolContext& context, std::string_view key, std::int32_t day) {
  KeyStory story(context);
  story.key = key;
  story.metric = story.metrics.find(key);
  story.day = day;
  story.measured = isMeasuredByReport(key);
  story.scalar = story.judge.judge(key, KeyKind::Scalar);
  story.distribution = story.judge.judge(key, KeyKind::Distribution);
  readRows(context, story);
  if (!story.measured && story.scalarRows.empty() && story.distributionRows.empty()) {
    story.similar = similarKeys(context, story);
  }
  story.trace.key = key;
  story.next = previewLog(*context.platform, day, &story.trace).document;
  story.submitted = SubmittedLogs(context).newest(day);
  story.submissionAllowed = context.platform->crashReporting->isDiagnosticSubmissionEnabled();
  story.unsent = whyUnsent(context, day, story.submitted.has_value());
  completeValues(context, story);
  return story;
}

const KvObject* loggedValue(const DailyLog& log, std::string_view key, KeyKind kind) {
  return (kind == KeyKind::Scalar ? log.scalars() : log.distributions()).get(key);
}

}  // namespace tally::tools
