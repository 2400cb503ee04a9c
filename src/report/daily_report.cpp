#include "report/daily_report.h"

#include <limits>

#include "report/device_metrics.h"
#include "report/document.h"
#include "report/read_figures.h"

namespace tally {
namespace {

void readHistory(MetricsStore& store, std::int32_t day, LogValues& values, ReadFigures& figures) {
  const auto history = store.openHistory();
  // A message may ask for any day, even the first one.
  const std::int32_t before = day == std::numeric_limits<std::int32_t>::min() ? day : day - 1;
  history->enumerateScalars("", before, day,
                            [&](std::string_view key, std::int32_t, std::int64_t value, bool&) {
                              figures.note(key, value);
                              if (const auto* options = values.scalarOptions(key)) {
                                values.addScalar(value, key, *options);
                              }
                            });
  history->enumerateDistributions(
      "", before, day,
      [&](std::string_view key, std::int32_t, DistributionValues& samples, bool&) {
        if (const auto* options = values.distributionOptions(key)) {
          values.addDistribution(samples, key, *options);
        }
      },
      [&](std::string_view key) { return values.admitsDistribution(key); });
  figures.damagedRows = history->damagedRows();
  values.finishDistributions();
}

}  // namespace

OwnMetrics writeDailyLog(Platform& platform, std::int32_t day, const KvArray* appInfo,
                         KeyTrace* trace) {
  LogValues values(*platform.log, Whitelist::load(platform), trace);
  platform.log->message(LogLevel::Info, "writing tallyd log. yesterday={}", day);
  ReadFigures figures(values.admittedOwn());
  readHistory(*platform.metricsStore, day, values, figures);
  if (values.empty()) return figures.admitted();
  recordApplications(platform, values);
  const auto metadata = makeMetadata(*platform.locale);
  recordDeviceMetrics(platform, values);
  figures.record(values);
  submitLog(platform, day, values, metadata, appInfo);
  return figures.admitted();
}

}  // namespace tally
