// The history pass: scalars and distributions of the day.
#include "report/report.h"

#include <limits>

#include "platform/platform.h"
#include "report/distribution_summary.h"

namespace tally {
TBReport::TBReport() : _config(TBConfig::init()) {}

const ScalarOptions* TBReport::scalarOptions(std::string_view key) const {
  return _config ? _config->configOptionsForScalarKey(key) : nullptr;
}

void TBReport::writeLogForYesterdayWithAppInfo(std::int32_t day, const KvArray* appInfo) {
  logMessage(LogLevel::Info, "writing tallyd log. yesterday={}", day);
  readHistory(day);
  serializeWithDateAndAppInfo(day, appInfo);
}

void TBReport::readHistory(std::int32_t day) {
  const auto history = platform().metricsStore->openHistory();
  // A message may ask for any day, even for the first there is.
  const std::int32_t before = day == std::numeric_limits<std::int32_t>::min() ? day : day - 1;
  history->enumerateScalars("", before, day,
                            [this](std::string_view key, std::int32_t, std::int64_t value, bool&) {
                              if (const auto* options = scalarOptions(key)) {
                                addScalarForKeyWithOptions(value, key, *options);
                              }
                            });
  history->enumerateDistributions(
      "", before, day,
      [this](std::string_view key, std::int32_t, DistributionValues& values, bool&) {
        const auto* options = _config ? _config->configOptionsForDistributionKey(key) : nullptr;
        if (options != nullptr) computeAndAddDistributionForKeyWithOptions(values, key, *options);
      });
}

std::int64_t TBReport::addScalarForKeyWithOptions(std::int64_t value, std::string_view key,
                                                  const ScalarOptions& options) {
  std::vector<RoundingStep>* steps = nullptr;
  if (_trace != nullptr && _trace->key == key) {
    _trace->scalarBefore = value;
    _trace->steps.clear();
    steps = &_trace->steps;
  }
  const std::int64_t rounded = roundScalar(value, options, steps);
  _scalarsOutput->set(key, KvNumber::int64(rounded));
  return rounded;
}

void TBReport::addScalarForKeyByExecutingBlock(std::string_view key, const Producer& producer) {
  const auto* options = scalarOptions(key);
  if (options == nullptr) return;
  if (const auto value = producer()) addScalarForKeyWithOptions(*value, key, *options);
}

void TBReport::computeAndAddDistributionForKeyWithOptions(DistributionValues& values,
                                                          std::string_view key,
                                                          const ScalarOptions& options) {
  const DistributionResult result = summariseDistribution(values, key, options);
  // A histogram without samples takes away what an earlier row of the key has left.
  if (result.hasHistogram) _histogramsOutput->set(key, result.histogram);
  _distributionsOutput->set(key, result.summary.toArray());
}

std::size_t TBReport::determineHistBucketForValueWithIntervals(
    double value, const HistogramIntervals& intervals) {
  return intervals.bucketOf(value);
}

KvRef<KvDictionary> TBReport::histogramDictForIntervalsWithHistCounts(
    const HistogramIntervals& intervals, std::span<const std::uint32_t> counts) {
  return makeHistogramDictionary(intervals, counts);
}

}  // namespace tally
