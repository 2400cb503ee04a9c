#include "report/histogram.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>

namespace tally {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

// More cells would take longer to fill than they save.
constexpr std::size_t kMostCells = 256;
constexpr std::size_t kMostStepsOfCell = 3;

// The pattern of a double as an integer with the order of doubles; both zeros have the same.
std::int64_t orderedBits(double value) {
  const auto bits = std::bit_cast<std::int64_t>(value + 0.0);
  return bits ^ ((bits >> 63) & std::numeric_limits<std::int64_t>::max());
}

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
  const std::size_t steps = steps_.size();
  positions_.resize(std::bit_ceil(steps + 1), static_cast<std::uint32_t>(boundaries.size()));
  steps_.resize(positions_.size() + kMostStepsOfCell, kInfinity);
  if (steps > 0) buildCells(steps);
}

void HistogramIntervals::buildCells(std::size_t steps) {
  const std::int64_t first = orderedBits(steps_[0]);
  const auto distance = [first](double value) {
    return static_cast<std::uint64_t>(orderedBits(value)) - static_cast<std::uint64_t>(first);
  };
  unsigned shift = 0;
  while ((distance(steps_[steps - 1]) >> shift) >= kMostCells - 1) ++shift;
  std::vector<std::uint16_t> cells(static_cast<std::size_t>(distance(steps_[steps - 1]) >> shift) +
                                   2);
  std::size_t most = 0;
  for (std::size_t i = 0; i < steps && most <= kMostStepsOfCell;) {
    const auto cell = static_cast<std::size_t>(distance(steps_[i]) >> shift) + 1;
    const std::size_t before = i;
    while (i < steps && (distance(steps_[i]) >> shift) + 1 == cell) ++i;
    most = std::max(most, i - before);
    std::fill(cells.begin() + static_cast<std::ptrdiff_t>(cell) + 1, cells.end(),
              static_cast<std::uint16_t>(i));
  }
  if (most > kMostStepsOfCell) return;
  cells_ = std::move(cells);
  firstCell_ = first;
  cellShift_ = shift;
  stepsOfCell_ = most;
}

std::size_t HistogramIntervals::bucketOf(double value) const {
  // Without branches, which random samples would make the processor mispredict; by pointer, since
  // the checks of operator[] are branches too. The halves add up to less than the size.
  const auto* const steps = steps_.data();
  std::size_t passed = 0;
  for (std::size_t half = positions_.size() / 2; half > 0; half /= 2) {
    passed += static_cast<std::size_t>(!(steps[passed + half - 1] >= value)) * half;
  }
  return positions_.data()[passed];
}

template <std::size_t kSteps>
void HistogramIntervals::countByCell(std::span<const double> samples,
                                     std::uint64_t* counters) const {
  const auto* const cells = cells_.data();
  const auto* const steps = steps_.data();
  const auto* const positions = positions_.data();
  const std::uint64_t lastCell = cells_.size() - 2;
  const std::size_t above = positions_.size() - 1;
  const std::int64_t first = firstCell_;
  const unsigned shift = cellShift_;
  for (const double sample : samples) {
    const std::int64_t bits = orderedBits(sample);
    const std::uint64_t distance =
        (static_cast<std::uint64_t>(bits) - static_cast<std::uint64_t>(first)) >> shift;
    const std::uint64_t cell = bits < first ? 0 : std::min(distance, lastCell) + 1;
    // All steps of earlier cells are below the sample, those of later ones are not.
    std::size_t passed = cells[cell];
    for (std::size_t i = 0; i < kSteps; ++i) {
      passed += static_cast<std::size_t>(!(steps[passed] >= sample));
    }
    passed = sample == sample ? passed : above;
    ++counters[positions[passed]];
  }
}

void HistogramIntervals::count(std::span<const double> samples, std::uint64_t* counters) const {
  if (cells_.empty()) {
    for (const double sample : samples) ++counters[bucketOf(sample)];
  } else if (stepsOfCell_ == 1) {
    countByCell<1>(samples, counters);
  } else {
    countByCell<kMostStepsOfCell>(samples, counters);
  }
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
