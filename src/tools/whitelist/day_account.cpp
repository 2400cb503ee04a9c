#include "tools/whitelist/day_account.h"

#include <algorithm>
#include <limits>
#include <tuple>
#include <utility>

#include "base/time_text.h"
#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "platform/tables/known_preferences.h"
#include "platform/tables/measured_metrics.h"
#include "tools/whitelist/refused_keys.h"

namespace tally::tools {
namespace {

auto placeOf(const KeyAccount& account) {
  return std::tuple(std::string_view(account.key), account.kind);
}

// Gathers what is known of the values.
class Collector {
 public:
  Collector(const ToolContext& context, std::int32_t day) : context_(context), day_(day) {}

  void readDay() {
    const std::int32_t before = day_ == std::numeric_limits<std::int32_t>::min() ? day_ : day_ - 1;
    KeyKind kind = KeyKind::Scalar;
    std::size_t damaged = 0;
    const auto history = openSqliteHistory(
        metricsStoreFile(context_.root),
        [&](const std::string& message) {
          context_.platform->log->fault("metrics store", "{}", message);
          storeFails_ = storeFails_ || damaged == 0;
        },
        [&](std::string_view key, std::int64_t) {
          ++damaged;
          if (isStoreKey(key)) add(key, kind).damaged = true;
        });
    history->enumerateScalars("", before, day_,
                              [&](std::string_view key, std::int32_t, std::int64_t, bool&) {
                                add(key, kind).stored = true;
                              });
    kind = KeyKind::Distribution;
    damaged = 0;
    history->enumerateDistributions(
        "", before, day_, [&](std::string_view key, std::int32_t, DistributionValues&, bool&) {
          add(key, kind).stored = true;
        });
  }

  void readStore() {
    listStoreKeys(
        metricsStoreFile(context_.root),
        [&](const StoreKey& key) {
          const bool scalar = key.kind == StoreKey::Kind::Scalar;
          ValueState& value = add(key.key, scalar ? KeyKind::Scalar : KeyKind::Distribution);
          value.elsewhen = key.firstDay != day_ || key.lastDay != day_;
        },
        [](const std::string&) {});
  }

  void addOthers() {
    for (const MeasuredMetric& metric : kMeasuredMetrics) {
      add(metric.key, KeyKind::Scalar).measured = true;
    }
    for (const RefusedKey& refused : refusedKeys(DeviceRoot(context_.root), day_)) {
      add(refused.key, refused.kind.value_or(KeyKind::Scalar)).refusal = refused.meaning;
    }
  }

  // By key and kind, each once.
  std::vector<KeyAccount> take() {
    std::ranges::stable_sort(keys_, {}, placeOf);
    std::size_t last = 0;
    for (std::size_t i = 1; i < keys_.size(); ++i) {
      if (placeOf(keys_[i]) != placeOf(keys_[last])) {
        if (++last != i) keys_[last] = std::move(keys_[i]);
        continue;
      }
      ValueState& value = keys_[last].value;
      const ValueState& other = keys_[i].value;
      value.stored = value.stored || other.stored;
      value.damaged = value.damaged || other.damaged;
      value.elsewhen = value.elsewhen || other.elsewhen;
      value.measured = value.measured || other.measured;
      if (value.refusal.empty()) value.refusal = other.refusal;
    }
    if (!keys_.empty()) keys_.resize(last + 1);
    for (KeyAccount& account : keys_) account.value.storeFails = storeFails_;
    return std::move(keys_);
  }

 private:
  ValueState& add(std::string_view key, KeyKind kind) {
    return keys_.emplace_back(KeyAccount{std::string(key), kind, {}, {}, {}}).value;
  }

  const ToolContext& context_;
  const std::int32_t day_;
  std::vector<KeyAccount> keys_;
  bool storeFails_ = false;
};

bool hasEarlierLog(const ToolContext& context, std::int32_t day) {
  const SubmittedLogs submitted(context);
  const auto logs = submitted.list();
  if (!logs) return false;
  return std::ranges::any_of(*logs, [&](const SpooledLog& log) {
    if (!isDailyLog(log)) return false;
    const auto body = submitted.read(log);
    const auto content = body ? DailyLog::parse(*body) : Result<DailyLog>(body.error());
    return content && content->day() && *content->day() < day;
  });
}

}  // namespace

WhitelistSection KeyAccount::section() const {
  const bool prefix = match.kind == WhitelistMatchKind::Prefix;
  if (kind == KeyKind::Scalar) {
    return prefix ? WhitelistSection::ScalarKeyPrefixes : WhitelistSection::ScalarKeys;
  }
  return prefix ? WhitelistSection::DistributionKeyPrefixes : WhitelistSection::DistributionKeys;
}

const KeyAccount* DayAccount::find(std::string_view key, KeyKind kind) const {
  const auto wanted = std::tuple(key, kind);
  const auto found = std::ranges::lower_bound(keys, wanted, {}, placeOf);
  return found != keys.end() && placeOf(*found) == wanted ? &*found : nullptr;
}

DayAccount accountOfDay(const ToolContext& context, const WhitelistJudge& judge, std::int32_t day,
                        const DailyLog* next, AccountScope scope) {
  Collector collector(context, day);
  collector.readDay();
  if (scope == AccountScope::Store) collector.readStore();
  collector.addOthers();
  DayAccount account;
  account.day = day;
  account.keys = collector.take();
  bool logMade = false;
  for (KeyAccount& key : account.keys) {
    key.match = judge.match(key.key, key.kind);
    logMade = logMade || (key.value.stored && key.match.options != nullptr);
  }
  for (KeyAccount& key : account.keys) {
    key.value.logMade = logMade;
    key.value.measurable = next == nullptr || next->scalars().contains(key.key);
    key.absence = whyNoValue(key.value);
    if (!key.absence && key.match.options == nullptr) {
      key.absence = judge.whyRefused(key.key, key.kind);
    }
    if (!key.absence) key.absence = whyNotMeasured(key.value);
  }
  account.unsent = whyUnsent(context, day, SubmittedLogs(context).newest(day).has_value());
  return account;
}

std::optional<AbsenceReason> whyUnsent(const ToolContext& context, std::int32_t day,
                                       bool isInSpool) {
  if (isInSpool) return std::nullopt;
  if (!context.platform->crashReporting->isDiagnosticSubmissionEnabled()) {
    return AbsenceReason{Absence::SubmissionForbidden, "submission is not allowed on this device"};
  }
  if (day >= context.platform->metricsStore->TBDaysSince1970()) {
    return AbsenceReason{Absence::DayNotProcessed, "the day is not over"};
  }
  const std::int32_t last = context.platform->preferences->SMAPreferencesGetIntegerValue(
      kLastProcessedDay.key, kLastProcessedDay.domain);
  if (day > last) {
    return AbsenceReason{Absence::DayNotProcessed,
                         last == 0
                             ? "the daily job has not recorded that it processed the day"
                             : fmt::format("{} is the last day that the daily job recorded as "
                                           "processed",
                                           dayText(last))};
  }
  // The log may have been collected; but whoever collects does not leave earlier ones behind.
  if (day < last && hasEarlierLog(context, day)) {
    return AbsenceReason{Absence::DayNotProcessed,
                         "the spool has a log of an earlier day, and none of this one"};
  }
  return std::nullopt;
}

AbsenceReason whyAbsentFrom(const DailyLog& submitted, const std::optional<AbsenceReason>& now,
                            std::string_view digest) {
  if (now) return *now;
  const auto* const then = submitted.document().getAs<KvString>("TBWhitelistDigest");
  if (then != nullptr && then->view() != digest) {
    return {Absence::NotListed, "the log was made with another whitelist"};
  }
  return {Absence::NoValueThatDay,
          "the log was made before it had a value, or while its group was not in force"};
}

}  // namespace tally::tools
