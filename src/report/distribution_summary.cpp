#include "report/distribution_summary.h"

#include <algorithm>
#include <limits>
#include <memory>
#include <new>
#include <optional>

namespace tally {
namespace {

// Samples taken at a time: they stay in the first-level cache between reading and counting.
constexpr std::size_t kSampleBatch = 1024;

// The most that weights add up to: nobody records so many samples one by one afterwards.
constexpr std::uint64_t kMostWeight = std::uint64_t{1} << 62;

template <bool kWithHistogram>
DistributionSummary addSamples(DistributionSummary summary, std::span<const double> samples,
                               const HistogramIntervals* intervals,
                               std::span<std::uint64_t> counts) {
  auto* const buckets = counts.data();  // bucketOf() stays within them
  for (const double sample : samples) {
    // The latency of the division dominates; the bucket search runs in parallel with it.
    ++summary.count;
    const double delta = sample - summary.mean;
    summary.mean += delta / static_cast<double>(summary.count);
    summary.squaredDeviations += delta * (sample - summary.mean);
    summary.minimum = sample < summary.minimum ? sample : summary.minimum;
    summary.maximum = sample > summary.maximum ? sample : summary.maximum;
    if constexpr (kWithHistogram) ++buckets[intervals->bucketOf(sample)];
  }
  return summary;
}

// The same sums with weights, in a loop of its own: samples without any are far more frequent.
DistributionSummary addWeighted(DistributionSummary summary, std::span<const double> samples,
                                std::span<const std::uint32_t> weights,
                                const HistogramIntervals* intervals,
                                std::span<std::uint64_t> counts) {
  const auto plus = [](std::uint64_t sum, std::uint32_t weight) {
    return std::min(sum + weight, kMostWeight);
  };
  for (std::size_t i = 0; i < samples.size(); ++i) {
    const double sample = samples[i], weight = weights[i];
    const auto count = plus(static_cast<std::uint64_t>(summary.count), weights[i]);
    if (summary.count == 0) {
      summary.minimum = summary.maximum = summary.mean = sample;
    } else {
      const double delta = sample - summary.mean;
      summary.mean += delta * weight / static_cast<double>(count);
      summary.squaredDeviations += weight * delta * (sample - summary.mean);
      summary.minimum = sample < summary.minimum ? sample : summary.minimum;
      summary.maximum = sample > summary.maximum ? sample : summary.maximum;
    }
    summary.count = static_cast<std::int64_t>(count);
    if (intervals == nullptr) continue;
    auto& bucket = counts[intervals->bucketOf(sample)];
    bucket = plus(bucket, weights[i]);
  }
  return summary;
}

}  // namespace

void DistributionSummary::add(std::span<const double> samples,
                              std::span<const std::uint32_t> weights,
                              const HistogramIntervals* intervals,
                              std::span<std::uint64_t> counts) {
  if (samples.empty()) return;
  if (!weights.empty()) {
    *this = addWeighted(*this, samples, weights, intervals, counts);
    return;
  }
  if (count == 0) {
    minimum = maximum = mean = samples.front();
    count = 1;
    if (intervals != nullptr) ++counts[intervals->bucketOf(samples.front())];
    samples = samples.subspan(1);
  }
  *this = intervals != nullptr ? addSamples<true>(*this, samples, intervals, counts)
                               : addSamples<false>(*this, samples, nullptr, {});
}

KvRef<KvArray> DistributionSummary::toArray() const {
  constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();
  return KvArray::create({KvNumber::float64(minimum), KvNumber::float64(maximum),
                          KvNumber::float64(mean), KvNumber::float64(squaredDeviations),
                          KvNumber::int32(static_cast<std::int32_t>(std::min(count, kMost)))});
}

DistributionResult summariseDistribution(SystemLog& log, DistributionValues& values,
                                         std::string_view key, const ScalarOptions& options) {
  DistributionResult result;
  std::optional<HistogramIntervals> intervals;
  std::unique_ptr<std::uint64_t[]> counters;
  std::span<std::uint64_t> counts;
  if (const auto* boundaries = options.getAs<KvArray>(kOptionIntervals)) {
    log.message(LogLevel::Debug, "Treating key {} as a histogram", key);
    intervals.emplace(*boundaries);
    counters.reset(new (std::nothrow) std::uint64_t[intervals->bucketCount()]());
    result.hasHistogram = counters != nullptr;
    if (result.hasHistogram) {
      counts = {counters.get(), intervals->bucketCount()};
    } else {
      log.repeated(LogLevel::Default, "distributions without a histogram",
                   "Couldn't allocate histCounts for key {}. Will not calculate histogram values",
                   key);
    }
  }
  const HistogramIntervals* counted = result.hasHistogram ? &*intervals : nullptr;
  double batch[kSampleBatch];
  while (const std::size_t count = values.nextValues(batch, nullptr, kSampleBatch)) {
    result.summary.add({batch, count}, values.weights(), counted, counts);
  }
  if (counted != nullptr) result.histogram = makeHistogramDictionary(*counted, counts);
  return result;
}

}  // namespace tally
