#include "host/store/store_conversion_day.h"

#include <algorithm>
#include <optional>

#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr const KnownPreference& kWhen = knownPreference("StoreConversion");
constexpr const KnownPreference& kCount = knownPreference("StoreConversionDays");
constexpr std::string_view kAtOnce = "at once", kNever = "never";
constexpr std::string_view kLast = "last", kDays = "days";
constexpr std::int64_t kDaysToWait = 30;

struct DayCount {
  std::int64_t last = 0, days = 0;
};

// Empty when there is none, or it cannot have been written by this program.
std::optional<DayCount> readCount(Preferences& preferences) {
  const auto value = preferences.get(kCount);
  const auto* const fields = kvCast<KvDictionary>(value.get());
  if (fields == nullptr) return std::nullopt;
  const auto last = fields->getInt64(kLast), days = fields->getInt64(kDays);
  if (!last || !days || *days < 1) return std::nullopt;
  return DayCount{*last, *days};
}

// A clock that jumps ahead makes one day, however far; one that was set back begins anew, since its
// days have been counted already.
DayCount countDay(std::optional<DayCount> former, std::int64_t today, std::int64_t processed) {
  // This program processes a day on a later one, which it has counted.
  const bool byAnother = former && processed >= former->last;
  if (!former || byAnother || today < former->last) return {today, 1};
  return {today, std::min(former->days, kDaysToWait) + (today > former->last ? 1 : 0)};
}

}  // namespace

bool conversionIsDue(Preferences& preferences, std::int32_t today) {
  const auto value = preferences.get(kWhen);
  const auto* const when = kvCast<KvString>(value.get());
  if (when != nullptr && when->view() == kAtOnce) return true;
  if (when != nullptr && when->view() == kNever) return false;
  const DayCount count = countDay(
      readCount(preferences), today,
      preferences.SMAPreferencesGetIntegerValue(kLastProcessedDay.key, kLastProcessedDay.domain));
  preferences.set(kCount, KvDictionary::create({{kLast, KvNumber::int64(count.last)},
                                                {kDays, KvNumber::int64(count.days)}}));
  return count.days > kDaysToWait;
}

void endConversion(Preferences& preferences) {
  if (preferences.get(kCount)) preferences.set(kCount, nullptr);
}

}  // namespace tally
