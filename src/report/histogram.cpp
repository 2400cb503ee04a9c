#include "report/histogram.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>

namespace tally {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

double boundaryAt(const KvArray& boundaries, std::size_t index) {
  return boundaries.getAs<KvNumber>(index)->asDouble();
}

}  // namespace

HistogramIntervals::HistogramIntervals(const KvArray& boundaries) : boundaries_(boundaries) {
  for (std::size_t i = 0; i < boundaries.size(); ++i) {
    const double boundary = boundaryAt(boundaries, i);
    if (std::isnan(boundary) || (!steps_.empty() && boundary <= steps_.back())) continue;
    steps_.push_back(boundary);
    positions_.push_back(static_cast<std::uint32_t>(i));
  }
  positions_.resize(std::bit_ceil(steps_.size() + 1),
                    static_cast<std::uint32_t>(boundaries.size()));
  steps_.resize(positions_.size() - 1, kInfinity);
}

std::string HistogramIntervals::label(std::size_t bucket) const {
  const auto infinity = KvNumber::float64(kInfinity);
  const auto minusInfinity = KvNumber::float64(-kInfinity);
  const bool last = bucket >= boundaries_.size();
  const KvObject* lower = bucket == 0 ? minusInfinity.get() : boundaries_.get(bucket - 1);
  const KvObject* upper = last ? infinity.get() : boundaries_.get(bucket);
  return "(" + kvText(lower) + ", " + kvText(upper) + (last ? ")" : "]");
}

KvRef<KvDictionary> makeHistogramDictionary(const HistogramIntervals& intervals,
                                            std::span<const std::uint64_t> counts) {
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint32_t>::max();
  KvRef<KvDictionary> histogram;
  for (std::size_t i = 0; i < counts.size(); ++i) {
    if (counts[i] == 0) continue;
    if (!histogram) histogram = KvDictionary::create(counts.size());
    histogram->set(intervals.label(i),
                   KvNumber::uint32(static_cast<std::uint32_t>(std::min(counts[i], kMost))));
  }
  return histogram;
}

}  // namespace tally
