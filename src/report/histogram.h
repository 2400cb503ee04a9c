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
  std::size_t bucketOf(double value) const;
  // Adds one to the counter of each sample's bucket. There are bucketCount() counters.
  void count(std::span<const double> samples, std::uint64_t* counters) const;
  // "(-inf, 10]", "(10, 20]", "(20, inf)": boundaries print as the numbers of the whitelist.
  std::string label(std::size_t bucket) const;

 private:
  const KvArray& boundaries_;
  template <std::size_t kSteps>
  void countByCell(std::span<const double> samples, std::uint64_t* counters) const;
  void buildCells(std::size_t steps);

  // The boundaries that exceed all before them: only these can be the first at or above a value.
  // Padded with infinity.
  std::vector<double> steps_;
  // The index of each step in the array, then n for every value above all of them; a power of two
  // of them, at least one more than there are steps.
  std::vector<std::uint32_t> positions_;
  // Cells of equal width over the ordered bit patterns of doubles, from the first step to the last:
  // how many steps are in cells before this one. The first cell is below all steps. Empty when some
  // cell has too many steps, and the steps are searched instead.
  std::vector<std::uint16_t> cells_;
  std::int64_t firstCell_ = 0;   // the pattern at which the second cell begins
  unsigned cellShift_ = 0;       // a cell is so many bits wide
  std::size_t stepsOfCell_ = 0;  // the most that one cell has
};

// The counters of the buckets that have samples, under their labels in bucket order; null when no
// bucket has any. There must be intervals.bucketCount() counters, which saturate at 32 bits here.
KvRef<KvDictionary> makeHistogramDictionary(const HistogramIntervals& intervals,
                                            std::span<const std::uint64_t> counts);

}  // namespace tally
