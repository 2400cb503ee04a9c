// The one-pass summary of a distribution's samples.
#pragma once

#include <cstdint>
#include <span>

#include "kv/value.h"
#include "report/histogram.h"

namespace tally {

// Five numbers about the samples seen so far; all 0 before the first.
struct DistributionSummary {
  double minimum = 0;
  double maximum = 0;
  double mean = 0;
  double squaredDeviations = 0;  // sum over the samples, from the mean, not divided by the count
  std::int64_t count = 0;

  // Takes further samples in the order in which they were recorded. With intervals, counts holds
  // one counter per bucket and each sample adds 1 to its own.
  void add(std::span<const double> samples, const HistogramIntervals* intervals,
           std::span<std::uint32_t> counts);
  // [minimum, maximum, mean, squared deviations, count]: four doubles and a signed 32-bit integer,
  // which saturates.
  KvRef<KvArray> toArray() const;
};

}  // namespace tally
