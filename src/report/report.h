// TBReport: one finished day of the metrics store as one daily log.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "config/config.h"
#include "kv/value.h"
#include "platform/metrics_store.h"
#include "report/histogram.h"
#include "report/scalar_rounding.h"

namespace tally {

// The preference domain of the program.
// The integer preference that holds the last day that the day check processed.
constexpr std::string_view kLastProcessedDay = "LastCrashLogSerializationDateInDaysSince1970";
// What log submission knows the daily log by.
constexpr std::string_view kDailyLogTypeCode = "193";
constexpr std::string_view kDailyLogName = "log-tallyd";
// What a million keys with long names and their histograms need; what fewer may have is a matter of
// the spool's bounds.
constexpr std::size_t kDailyLogMaximumBytes = 256u << 20;

// True for the scalars that the report measures itself instead of reading them from the store.
bool isMeasuredByReport(std::string_view key);

// The kernel values that those are made from, with the bytes that are read of each.
struct KernelValueName {
  std::string name;
  std::size_t width;
};
std::vector<KernelValueName> kernelValuesOfReport();

// What became of one key on its way into a log, for those who want to follow it.
struct KeyTrace {
  std::string key;
  // The scalar as it was handed to the report, and each step of its rounding.
  std::optional<std::int64_t> scalarBefore;
  std::vector<RoundingStep> steps;
};

// Used for one day: create, call writeLogForYesterdayWithAppInfo once, discard.
class TBReport {
 public:
  // Loads the whitelist; one that cannot be loaded admits no key.
  TBReport();

  // Fills the trace while the log is built; it must outlive the report.
  void follow(KeyTrace& trace) { _trace = &trace; }

  // Reads the history of the day, builds the log and submits it. appInfo may be null. Nothing is
  // submitted when no key of the day is whitelisted. Failures are logged.
  void writeLogForYesterdayWithAppInfo(std::int32_t day, const KvArray* appInfo);
  void serializeWithDateAndAppInfo(std::int32_t day, const KvArray* appInfo);

  // Records the value as its options round it; returns what was recorded.
  std::int64_t addScalarForKeyWithOptions(std::int64_t value, std::string_view key,
                                          const ScalarOptions& options);
  // Reads every sample; records the five statistics and, with "intervals", the histogram.
  void computeAndAddDistributionForKeyWithOptions(DistributionValues& values, std::string_view key,
                                                  const ScalarOptions& options);
  // Runs the producer only when the key is whitelisted; an empty result is not recorded.
  using Producer = std::function<std::optional<std::int64_t>()>;
  void addScalarForKeyByExecutingBlock(std::string_view key, const Producer& producer);

  static std::size_t determineHistBucketForValueWithIntervals(double value,
                                                              const HistogramIntervals& intervals);
  static KvRef<KvDictionary> histogramDictForIntervalsWithHistCounts(
      const HistogramIntervals& intervals, std::span<const std::uint32_t> counts);

  // What the report measures itself, each for whitelisted keys only.
  void addInstalledAppInfo();
  void addMetadataKeys();
  void reportDatabaseSize();
  void reportCPUUptime();
  void reportVMStats();

 private:
  const ScalarOptions* scalarOptions(std::string_view key) const;
  void readHistory(std::int32_t day);
  void recordKernelCounters(std::span<const struct KernelCounter> counters);
  void recordPercentages(std::string_view denominator, std::span<const std::string_view> names);
  KvRef<KvDictionary> makeDocument(std::int32_t day, const KvArray* appInfo);

  std::unique_ptr<TBConfig> _config;
  KeyTrace* _trace = nullptr;
  KvRef<KvDictionary> _scalarsOutput = KvDictionary::create();
  KvRef<KvDictionary> _distributionsOutput = KvDictionary::create();
  KvRef<KvDictionary> _histogramsOutput = KvDictionary::create();
  KvRef<KvDictionary> _metadataOutput = KvDictionary::create();
};

}  // namespace tally
