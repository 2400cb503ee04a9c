#include "tools/page/page_log.h"

#include <algorithm>
#include <nlohmann/json.hpp>
#include <utility>

#include "base/natural_order.h"
#include "base/time_text.h"
#include "platform/platform.h"
#include "tools/page/page_facts.h"
#include "tools/page/page_tables.h"
#include "tools/privacy/measure_privacy.h"
#include "tools/report/log_diff.h"
#include "tools/whitelist/day_account.h"
#include "tools/whitelist/key_story.h"

namespace tally::tools {
namespace {

// Above this, the numbers of JavaScript have gaps; such integers go as text.
constexpr std::int64_t kLargestExact = (std::int64_t{1} << 53) - 1;

Json jsonOfInteger(std::int64_t value) {
  if (value >= -kLargestExact && value <= kLargestExact) return value;
  return std::to_string(value);
}

Json jsonOfStatistics(const KvObject* value) {
  const auto statistics = statisticsOf(value);
  if (!statistics) return nullptr;
  return {statistics->count, jsonOfReal(statistics->minimum), jsonOfReal(statistics->maximum),
          jsonOfReal(statistics->mean), jsonOfReal(statistics->standardDeviation())};
}

// [[label, samples], ...]; null without a histogram.
Json jsonOfHistogram(const KvObject* value) {
  const auto* histogram = kvCast<KvDictionary>(value);
  if (histogram == nullptr) return nullptr;
  Json buckets = Json::array();
  for (const auto& bucket : *histogram) {
    const auto* count = kvCast<KvNumber>(bucket.value.get());
    buckets.push_back(
        {bucket.key->view(), count != nullptr ? jsonOfInteger(count->asInt64()) : Json(nullptr)});
  }
  return buckets;
}

// The keys of one kind, as columns of equal length.
struct Columns {
  Json key = Json::array(), value = Json::array(), metric = Json::array(), entry = Json::array(),
       reveal = Json::array(), former = Json::array();
  Json object() {
    return {{"key", std::move(key)},       {"value", std::move(value)},
            {"metric", std::move(metric)}, {"entry", std::move(entry)},
            {"reveal", std::move(reveal)}, {"former", std::move(former)}};
  }
};

Json jsonOfScalar(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  return number != nullptr ? jsonOfInteger(number->asInt64()) : Json("?");
}

class BlockBuilder {
 public:
  BlockBuilder(const PageSources& sources, const PageLog& log)
      : sources_(sources), log_(log), tables_(sources) {
    const auto* digest =
        log.content ? log.content->document().getAs<KvString>("TBWhitelistDigest") : nullptr;
    isUsable_ = sources.judge.index() != nullptr;
    sameWhitelist_ = isUsable_ && digest != nullptr && digest->view() == whitelist().digest;
  }

  Json build() {
    Json block = {{"notes", log_.notes},
                  {"facts", pageFacts(sources_, log_)},
                  {"isNext", !log_.spooled.has_value()}};
    if (log_.content) {
      block["sameWhitelist"] = sameWhitelist_;
      if (!sameWhitelist_) block["notes"].push_back(whitelistNote());
      block["applications"] = pageApplications(*log_.content);
      block["before"] =
          log_.before && log_.before->day() ? Json(dayText(*log_.before->day())) : Json(nullptr);
      block["scalars"] = scalars();
      block["distributions"] = distributions();
      block["removed"] = std::move(removed_);
    }
    if (log_.day) block["absent"] = absent();
    if (sameWhitelist_ && sources_.privacy.firstDay) {
      block["bits"] = {sources_.privacy.bits, dayText(*sources_.privacy.firstDay),
                       dayText(*sources_.privacy.lastDay)};
    }
    tables_.moveInto(block);
    return block;
  }

 private:
  const WhitelistFile& whitelist() const { return sources_.judge.file(); }

  std::string whitelistNote() const {
    if (isUsable_) {
      return "This log was made under another whitelist than the one that is installed now. Which "
             "group admitted a key, and how it was rounded, is therefore not known; the reasons "
             "why others stayed are those of the present whitelist.";
    }
    return "The whitelist cannot be used now (" + whitelist().fault +
           "), so which group admitted a key, and how it was rounded, is not known.";
  }

  // Adds a key's cells that both kinds have.
  template <class Convert>
  void add(Columns& columns, std::string_view key, const KvObject* value, KeyKind kind,
           const std::vector<Difference>& changes, const Convert& convert) {
    columns.key.push_back(key);
    columns.value.push_back(convert(value));
    columns.metric.push_back(tables_.metricOf(key));
    columns.entry.push_back(sameWhitelist_ ? tables_.entryOf(sources_.judge.match(key, kind), kind)
                                           : PageTables::kNone);
    columns.reveal.push_back(sameWhitelist_ ? tables_.revealOf(key, kind) : PageTables::kNone);
    if (log_.before) columns.former.push_back(formerOf(changes, key, convert));
  }

  // What differs, ordered by key; what is gone is noted.
  std::vector<Difference> changesOf(const KvDictionary& before, const KvDictionary& after,
                                    KeyKind kind) {
    auto changes = differences(before, after);
    for (const Difference& change : changes) {
      if (change.after != nullptr) continue;
      removed_.push_back(
          {kindName(kind), change.key,
           kind == KeyKind::Scalar ? jsonOfScalar(change.before) : jsonOfStatistics(change.before),
           tables_.metricOf(change.key)});
    }
    return changes;
  }

  // True: the same as before; null: new; else the former value.
  template <class Convert>
  static Json formerOf(const std::vector<Difference>& changes, std::string_view key,
                       const Convert& convert) {
    const auto change = std::ranges::lower_bound(changes, key, naturalLess, &Difference::key);
    if (change == changes.end() || change->key != key) return true;
    return change->before != nullptr ? convert(change->before) : Json(nullptr);
  }

  Json scalars() {
    const KvDictionary& scalars = log_.content->scalars();
    std::vector<Difference> changes;
    if (log_.before) changes = changesOf(log_.before->scalars(), scalars, KeyKind::Scalar);
    Columns columns;
    Json ranges = Json::array();
    for (const auto* entry : entriesByName(scalars)) {
      const KvObject* const value = entry->value.get();
      add(columns, entry->key->view(), value, KeyKind::Scalar, changes, jsonOfScalar);
      const auto* number = kvCast<KvNumber>(value);
      ranges.push_back(number != nullptr
                           ? tables_.rangeOf(number->asInt64(), columns.entry.back().get<int>())
                           : PageTables::kNone);
    }
    Json object = columns.object();
    object["range"] = std::move(ranges);
    return object;
  }

  Json distributions() {
    const DailyLog& log = *log_.content;
    std::vector<Difference> changes;
    if (log_.before) {
      changes = changesOf(log_.before->distributions(), log.distributions(), KeyKind::Distribution);
    }
    Columns columns;
    Json histograms = Json::array();
    for (const auto* entry : entriesByName(log.distributions())) {
      const std::string_view key = entry->key->view();
      add(columns, key, entry->value.get(), KeyKind::Distribution, changes, jsonOfStatistics);
      histograms.push_back(jsonOfHistogram(log.histograms().get(key)));
    }
    Json object = columns.object();
    object["histogram"] = std::move(histograms);
    return object;
  }

  // What the device recorded on the day that the log does not have.
  Json absent() {
    const bool isNext = !log_.spooled;
    const DailyLog* const content = log_.content ? &*log_.content : nullptr;
    const DayAccount account =
        accountOfDay(sources_.context, sources_.judge, *log_.day, isNext ? content : nullptr);
    Json keys = Json::array(), kinds = keys, reasons = keys, metrics = keys;
    const bool nothingLeaves = isNext && !sources_.submissionAllowed;
    for (const KeyAccount& key : account.keys) {
      const ValueState& value = key.value;
      const bool isRecorded = value.stored || value.damaged || !value.refusal.empty();
      const bool isLogged =
          content != nullptr && loggedValue(*content, key.key, key.kind) != nullptr;
      if (!isRecorded || (isLogged && !nothingLeaves)) continue;
      std::optional<AbsenceReason> reason = key.absence;
      if (!isNext && content != nullptr) {
        reason = whyAbsentFrom(*content, key.absence, whitelist().digest);
      }
      if (!reason) reason = account.unsent;
      if (!reason) continue;
      keys.push_back(key.key);
      kinds.push_back(static_cast<int>(key.kind));
      reasons.push_back(tables_.reasonOf(*reason));
      metrics.push_back(tables_.metricOf(key.key));
    }
    return {{"key", std::move(keys)},
            {"kind", std::move(kinds)},
            {"reason", std::move(reasons)},
            {"metric", std::move(metrics)}};
  }

  const PageSources& sources_;
  const PageLog& log_;
  bool isUsable_ = false, sameWhitelist_ = false;
  PageTables tables_;
  Json removed_ = Json::array();
};

}  // namespace

PageSources::PageSources(const ToolContext& tool)
    : context(tool),
      metrics(knownMetrics(tool)),
      judge(*tool.platform, loadWhitelistFile(*tool.platform)),
      privacy(measurePrivacy(tool, judge, metrics)),
      submissionAllowed(tool.platform->crashReporting->isDiagnosticSubmissionEnabled()) {}

Json pageBlock(const PageSources& sources, const PageLog& log) {
  return BlockBuilder(sources, log).build();
}

}  // namespace tally::tools
