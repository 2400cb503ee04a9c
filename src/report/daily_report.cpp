#include "report/daily_report.h"

#include <limits>

#include "report/device_metrics.h"
#include "report/document.h"

namespace tally {
namespace {

void readHistory(MetricsStore& store, std::int32_t day, LogValues& values) {
  const auto history = store.openHistory();
  // A message may ask for any day, even the first one.
  const std::int32_t before = day == std::numeric_limits<std::int32_t>::min() ? day : day - 1;
  history->enumerateScalars("", before, day,
                            [&](std::string_view key, std::int32_t, std::int64_t value, bool&) {
                              if (const auto* options = values.scalarOptions(key)) {
                                values.addScalar(value, key, *options);
                              }
                            });
  history->enumerateDistributions(
      "", before, day, [&](std::string_view key, std::int32_t, DistributionValues& samples, bool&) {
        if (const auto* options = values.distributionOptions(key)) {
          values.addDistribution(samples, key, *options);
        }
      });
}

}  // namespace

void writeDailyLog(Platform& platform, std::int32_t day, const KvArray* appInfo, KeyTrace* trace) {
  LogValues values(*platform.log, Whitelist::load(platform), trace);
  platform.log->message(LogLevel::Info, "writing tallyd log. yesterday={}", day);
  readHistory(*platform.metricsStore, day, values);
  if (values.empty()) return;
  recordApplications(platform, values);
  const auto metadata = makeMetadata(*platform.locale);
  recordDeviceMetrics(platform, values);
  submitDocument(platform, *makeDocument(platform, day, values, metadata, appInfo));
}

}  // namespace tally
