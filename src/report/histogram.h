// Histogram buckets of a distribution.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "kv/value.h"

namespace tally {

// The boundaries b0 … b(n-1) of n + 1 buckets, in a form that is fast to search. Buckets are open
// on the left and closed on the right; the last is open on both sides.
class HistogramIntervals {
 public:
  // The boundaries are numbers in any order; they are borrowed and must outlive this object.
  explicit HistogramIntervals(const KvArray& boundaries);

  std::size_t bucketCount() const { return boundaries_.size() + 1; }
  // The position of the first boundary, in array order, that is at or above the value; n when there
  // is none, as for a NaN.
  std::size_t bucketOf(double value) const {
    // Without branches, which random samples would make the processor mispredict; by pointer, since
    // the checks of operator[] are branches too. The halves add up to less than the size.
    const auto* const steps = steps_.data();
    std::size_t passed = 0;
    for (std::size_t half = positions_.size() / 2; half > 0; half /= 2) {
      passed += static_cast<std::size_t>(!(steps[passed + half - 1] >= value)) * half;
    }
    return positions_.data()[passed];
  }
  // "(-inf, 10]", "(10, 20]", "(20, inf)": boundaries print as the numbers of the whitelist.
  std::string label(std::size_t bucket) const;

 private:
  const KvArray& boundaries_;
  // The boundaries that exceed all before them: only these can be the first at or above a value.
  // Padded with infinity to one less than a power of two.
  std::vector<double> steps_;
  // The index of each step in the array, then n for every value above all of them.
  std::vector<std::uint32_t> positions_;
};

// The counters of the buckets that have samples, under their labels in bucket order; null when no
// bucket has any. There must be intervals.bucketCount() counters, which saturate at 32 bits here.
KvRef<KvDictionary> makeHistogramDictionary(const HistogramIntervals& intervals,
                                            std::span<const std::uint64_t> counts);

}  // namespace tally
