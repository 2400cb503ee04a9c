// The history pass: scalars and distributions of the day.
#include "report/report.h"

#include <new>
#include <vector>

#include "platform/platform.h"
#include "report/distribution_summary.h"
#include "report/scalar_rounding.h"

namespace tally {
namespace {

// Samples taken at a time: they stay in the first-level cache between reading and counting.
constexpr std::size_t kSampleBatch = 1024;

}  // namespace

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
  history->enumerateScalars("", day - 1, day,
                            [this](std::string_view key, std::int32_t, std::int64_t value, bool&) {
                              if (const auto* options = scalarOptions(key)) {
                                addScalarForKeyWithOptions(value, key, *options);
                              }
                            });
  history->enumerateDistributions(
      "", day - 1, day,
      [this](std::string_view key, std::int32_t, DistributionValues& values, bool&) {
        const auto* options = _config ? _config->configOptionsForDistributionKey(key) : nullptr;
        if (options != nullptr) computeAndAddDistributionForKeyWithOptions(values, key, *options);
      });
}

std::int64_t TBReport::addScalarForKeyWithOptions(std::int64_t value, std::string_view key,
                                                  const ScalarOptions& options) {
  const std::int64_t rounded = roundScalar(value, options);
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
  std::optional<HistogramIntervals> intervals;
  std::unique_ptr<std::uint32_t[]> counters;
  std::span<std::uint32_t> counts;
  if (const auto* boundaries = options.getAs<KvArray>(kOptionIntervals)) {
    logMessage(LogLevel::Debug, "Treating key {} as a histogram", key);
    intervals.emplace(*boundaries);
    counters.reset(new (std::nothrow) std::uint32_t[intervals->bucketCount()]());
    if (counters) {
      counts = {counters.get(), intervals->bucketCount()};
    } else {
      intervals.reset();
      logMessage(LogLevel::Default,
                 "Couldn't allocate histCounts for key {}. Will not calculate histogram values",
                 key);
    }
  }
  DistributionSummary summary;
  double batch[kSampleBatch];
  while (const std::size_t count = values.nextValues(batch, nullptr, kSampleBatch)) {
    summary.add({batch, count}, intervals ? &*intervals : nullptr, counts);
  }
  if (intervals) {
    _histogramsOutput->set(key, histogramDictForIntervalsWithHistCounts(*intervals, counts));
  }
  _distributionsOutput->set(key, summary.toArray());
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
