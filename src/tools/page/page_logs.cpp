#include "tools/page/page_logs.h"

#include <algorithm>
#include <nlohmann/json.hpp>
#include <set>

#include "base/time_text.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "tools/report/preview.h"

namespace tally::tools {
namespace {

// The day whose log the daily job has not made yet.
std::int32_t nextDay(Platform& platform) {
  const std::int32_t today = platform.metricsStore->TBDaysSince1970();
  const std::int32_t processed = platform.preferences->SMAPreferencesGetIntegerValue(
      kLastProcessedDay.key, kLastProcessedDay.domain);
  return processed >= today - 1 ? today : today - 1;
}

bool hasValues(MetricsStore& store, std::int32_t day) {
  bool found = false;
  const auto history = store.openHistory();
  history->enumerateScalars(
      "", day - 1, day,
      [&](std::string_view, std::int32_t, std::int64_t, bool& stop) { found = stop = true; });
  if (found) return true;
  history->enumerateDistributions(
      "", day - 1, day, [&](std::string_view, std::int32_t, DistributionValues&, bool& stop) {
        found = stop = true;
      });
  return found;
}

std::string whyNoLog(const PageSources& sources, std::int32_t day) {
  if (sources.judge.index() == nullptr) {
    return "No log would be submitted: the whitelist cannot be used (" +
           sources.judge.file().fault + "), and without one nothing leaves.";
  }
  if (!hasValues(*sources.context.platform->metricsStore, day)) {
    return "No log would be submitted: the store has no value of that day.";
  }
  return "No log would be submitted: the store has values of that day, but the whitelist admits "
         "none of them.";
}

PageLog nextLog(const PageSources& sources) {
  Platform& platform = *sources.context.platform;
  PageLog next;
  next.day = nextDay(platform);
  Preview made = previewLog(platform, *next.day);
  if (auto content = DailyLog::of(made.document)) next.content = std::move(*content);
  next.options = std::move(made.options);
  if (!sources.submissionAllowed) {
    next.notes.push_back(
        "Submission is not allowed on this device (submission_forbidden), so nothing of this "
        "leaves. "
        "The page shows what would leave if it was allowed.");
  }
  if (!next.content) {
    next.notes.push_back(whyNoLog(sources, *next.day));
  } else if (*next.day == platform.metricsStore->TBDaysSince1970()) {
    next.notes.push_back("The day is not over (day_not_processed): its values still change.");
  }
  return next;
}

PageLog submittedLog(const SubmittedLogs& logs, const SpooledLog& spooled) {
  PageLog log;
  log.spooled = spooled;
  log.options = spooled.options;
  const auto body = logs.read(spooled);
  auto content = body ? DailyLog::parse(*body) : Result<DailyLog>(body.error());
  if (content) {
    log.day = content->day();
    log.content = std::move(*content);
  } else {
    log.notes.push_back("This log cannot be read: " + content.error().message + ".");
  }
  return log;
}

// Each log is compared with the newest one of an earlier day.
void findFormer(std::vector<PageLog>& logs) {
  for (PageLog& log : logs) {
    const PageLog* former = nullptr;
    for (const PageLog& other : logs) {
      if (!log.day || !other.content || !other.spooled || !other.day || *other.day >= *log.day) {
        continue;
      }
      if (former == nullptr || *other.day > *former->day) former = &other;
    }
    if (former != nullptr) log.before = former->content;
  }
}

}  // namespace

Result<std::vector<PageLog>> pageLogs(const PageSources& sources, std::uint32_t days) {
  const SubmittedLogs submitted(sources.context);
  const auto all = submitted.list();
  if (!all) return all.error();
  std::vector<PageLog> logs;
  logs.push_back(nextLog(sources));
  // One day more than is shown, to compare the oldest with.
  std::set<std::int32_t> seen;
  std::optional<std::size_t> shown;
  for (auto spooled = all->rbegin(); spooled != all->rend() && seen.size() <= days; ++spooled) {
    if (!isDailyLog(*spooled)) continue;
    PageLog log = submittedLog(submitted, *spooled);
    if (log.day) seen.insert(*log.day);
    if (seen.size() > days && !shown) shown = logs.size();
    logs.push_back(std::move(log));
  }
  findFormer(logs);
  if (shown) logs.erase(logs.begin() + static_cast<std::ptrdiff_t>(*shown), logs.end());
  return logs;
}

}  // namespace tally::tools
