#include "report/distribution_summary.h"

#include <algorithm>
#include <limits>
#include <new>

namespace tally {
namespace {

// Samples taken at a time: they stay in the first-level cache between reading and counting.
constexpr std::size_t kSampleBatch = 1024;

// The most that weights add up to: nobody records so many samples one by one afterwards.
constexpr std::uint64_t kMostWeight = std::uint64_t{1} << 62;

DistributionSummary addSamples(DistributionSummary summary, std::span<const double> samples) {
  for (const double sample : samples) {
    ++summary.count;
    const double delta = sample - summary.mean;
    summary.mean += delta / static_cast<double>(summary.count);
    summary.squaredDeviations += delta * (sample - summary.mean);
    summary.minimum = sample < summary.minimum ? sample : summary.minimum;
    summary.maximum = sample > summary.maximum ? sample : summary.maximum;
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
  if (intervals != nullptr) intervals->count(samples, counts.data());
  if (count == 0) {
    minimum = maximum = mean = samples.front();
    count = 1;
    samples = samples.subspan(1);
  }
  *this = addSamples(*this, samples);
}

KvRef<KvArray> DistributionSummary::toArray() const {
  constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();
  return KvArray::create({KvNumber::float64(minimum), KvNumber::float64(maximum),
                          KvNumber::float64(mean), KvNumber::float64(squaredDeviations),
                          KvNumber::int32(static_cast<std::int32_t>(std::min(count, kMost)))});
}

DistributionCounter::DistributionCounter(SystemLog& log, std::string_view key,
                                         const ScalarOptions& options) {
  const auto* boundaries = options.getAs<KvArray>(kOptionIntervals);
  if (boundaries == nullptr) return;
  log.message(LogLevel::Debug, "Treating key {} as a histogram", key);
  intervals_.emplace(*boundaries);
  counters_.reset(new (std::nothrow) std::uint64_t[intervals_->bucketCount()]());
  if (!counters_) {
    log.repeated(LogLevel::Default, "distributions without a histogram",
                 "Couldn't allocate histCounts for key {}. Will not calculate histogram values",
                 key);
  }
}

void DistributionCounter::addToHistogram(std::span<const double> samples) {
  if (counters_) intervals_->count(samples, counters_.get());
}

DistributionResult DistributionCounter::result() const {
  DistributionResult result;
  result.summary = summary;
  result.hasHistogram = counters_ != nullptr;
  if (counters_) result.histogram = makeHistogramDictionary(*intervals_, counts());
  return result;
}

DistributionResult summariseDistribution(SystemLog& log, DistributionValues& values,
                                         std::string_view key, const ScalarOptions& options) {
  DistributionCounter counter(log, key, options);
  double batch[kSampleBatch];
  while (const std::size_t count = values.nextValues(batch, nullptr, kSampleBatch)) {
    counter.add({batch, count}, values.weights());
  }
  return counter.result();
}

}  // namespace tally
