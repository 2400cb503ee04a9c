// The one-pass summary of a distribution's samples.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string_view>

#include "config/whitelist_options.h"
#include "kv/value.h"
#include "platform/metrics_store.h"
#include "platform/system_log.h"
#include "report/histogram.h"

namespace tally {

// Five numbers about the samples seen so far; all 0 before the first.
struct DistributionSummary {
  double minimum = 0;
  double maximum = 0;
  double mean = 0;
  double squaredDeviations = 0;  // sum over the samples, from the mean, not divided by the count
  std::int64_t count = 0;        // sum of the weights

  // Adds further samples, in the order in which they were recorded. A sample with a weight counts
  // as so many; without weights, each counts once. With intervals, counts has one counter per
  // bucket, and each sample is counted in that of its bucket.
  void add(std::span<const double> samples, std::span<const std::uint32_t> weights,
           const HistogramIntervals* intervals, std::span<std::uint64_t> counts);
  // [minimum, maximum, mean, squared deviations, count]: four doubles and a signed 32-bit integer,
  // which saturates.
  KvRef<KvArray> toArray() const;
};

// A distribution as its options report it.
struct DistributionResult {
  DistributionSummary summary;
  bool hasHistogram = false;      // "intervals" were given and their counters could be allocated
  KvRef<KvDictionary> histogram;  // null when no bucket has samples
};

// A distribution while its samples are read. The options must outlive it; the key is for messages.
class DistributionCounter {
 public:
  DistributionCounter(SystemLog& log, std::string_view key, const ScalarOptions& options);
  // As DistributionSummary::add().
  void add(std::span<const double> samples, std::span<const std::uint32_t> weights) {
    summary.add(samples, weights, histogram(), counts());
  }
  // Counts samples in their buckets alone.
  void addToHistogram(std::span<const double> samples);
  DistributionResult result() const;

  DistributionSummary summary;

 private:
  const HistogramIntervals* histogram() const { return counters_ ? &*intervals_ : nullptr; }
  std::span<std::uint64_t> counts() const {
    return counters_ ? std::span(counters_.get(), intervals_->bucketCount())
                     : std::span<std::uint64_t>();
  }
  std::optional<HistogramIntervals> intervals_;
  std::unique_ptr<std::uint64_t[]> counters_;  // null: no histogram
};

// Reads every sample, in one pass and constant memory. The key is for messages.
DistributionResult summariseDistribution(SystemLog& log, DistributionValues& values,
                                         std::string_view key, const ScalarOptions& options);

}  // namespace tally
