#include "tools/report/daily_log.h"

#include <algorithm>
#include <cmath>

#include "base/number_text.h"
#include "base/time_text.h"
#include "host/linux_platform.h"
#include "kv/plist_codec.h"
#include "report/document.h"

namespace tally::tools {

Result<DailyLog> DailyLog::parse(std::string_view bytes) {
  const auto root = decodePlist(bytes, kDailyLogMaximumBytes);
  if (!root) return root.error();
  return of(KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get())));
}

Result<DailyLog> DailyLog::of(KvRef<KvDictionary> document) {
  if (!document || !document->contains("TBCrashLogVersion")) return Error{"not a daily log"};
  return DailyLog(std::move(document));
}

std::optional<std::int32_t> DailyLog::day() const {
  const auto* date = document_->getAs<KvDate>("TBStartDate");
  if (date == nullptr) return std::nullopt;
  return dayOfSeconds(date->secondsSince1970());
}

const KvDictionary& DailyLog::part(std::string_view name) const {
  static const KvRef<KvDictionary> kEmpty = KvDictionary::create();
  const auto* dictionary = document_->getAs<KvDictionary>(name);
  return dictionary != nullptr ? *dictionary : *kEmpty;
}

double Statistics::standardDeviation() const {
  return count > 0 ? std::sqrt(squaredDeviations / static_cast<double>(count)) : 0;
}

std::optional<Statistics> statisticsOf(const KvObject* value) {
  constexpr std::size_t kNumbers = 5;
  const auto* array = kvCast<KvArray>(value);
  if (array == nullptr || array->size() != kNumbers) return std::nullopt;
  double numbers[kNumbers];
  for (std::size_t i = 0; i < kNumbers; ++i) {
    const auto* number = array->getAs<KvNumber>(i);
    if (number == nullptr) return std::nullopt;
    numbers[i] = number->asDouble();
  }
  return Statistics{numbers[0], numbers[1], numbers[2], numbers[3],
                    array->getAs<KvNumber>(4)->asInt64()};
}

bool isDailyLog(const SpooledLog& log) {
  return log.typeCode == kDailyLogTypeCode && log.name == kDailyLogName;
}

std::string_view faultOf(const SpooledLog& log, const Result<std::string>& body) {
  if (!body || log.name.empty()) return "damaged";
  if (!isDailyLog(log) || DailyLog::parse(*body)) return "";
  return decodePlist(*body, kDailyLogMaximumBytes) ? "not a daily log" : "damaged";
}

SubmittedLogs::SubmittedLogs(const ToolContext& context) : reader_(spoolFolder(context.root)) {}

Result<std::optional<SpooledLog>> SubmittedLogs::find(std::string_view name) const {
  const auto logs = list();
  if (!logs) return logs.error();
  const auto number = parseInt64(name);
  const auto wanted = [&](const SpooledLog& log) {
    if (name.empty()) return isDailyLog(log);
    if (number) return static_cast<std::int64_t>(log.sequence) == *number;
    return log.fileName == name || log.fileName == std::string(name) + ".log";
  };
  const auto found = std::find_if(logs->rbegin(), logs->rend(), wanted);
  if (found == logs->rend()) return std::optional<SpooledLog>();
  return std::optional(*found);
}

Result<std::string> SubmittedLogs::read(const SpooledLog& log) const {
  return reader_.readBody(log, kDailyLogMaximumBytes);
}

std::optional<SubmittedLogs::Found> SubmittedLogs::newest(std::optional<std::int32_t> day) const {
  const auto logs = list();
  if (!logs) return std::nullopt;
  for (auto log = logs->rbegin(); log != logs->rend(); ++log) {
    if (!isDailyLog(*log)) continue;
    const auto body = read(*log);
    if (!body) continue;
    auto content = DailyLog::parse(*body);
    if (!content || (day && content->day() != day)) continue;
    return Found{*log, std::move(*content)};
  }
  return std::nullopt;
}

}  // namespace tally::tools
