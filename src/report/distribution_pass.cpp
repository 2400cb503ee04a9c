#include "report/distribution_pass.h"

#include <algorithm>
#include <bit>
#include <utility>
#include <vector>

namespace tally {
namespace {

// Two of what a processor computes at once, each as if alone.
using Pair = double __attribute__((vector_size(16)));

// Samples between two steps into the buckets, few enough to stay in the first-level cache.
constexpr std::size_t kBlock = 512;

struct Lane {
  const double* samples;
  std::size_t count;
  DistributionCounter* counter;
};

// The samples [from, to) of two lanes for each pair. REQUIRES: each lane has counted `from` samples
// and has further ones up to `to`.
template <std::size_t kPairs>
void addPairs(const Lane* const* lanes, std::size_t from, std::size_t to) {
  Pair minimum[kPairs], maximum[kPairs], mean[kPairs], squared[kPairs];
  const double* samples[2 * kPairs];
  for (std::size_t p = 0; p < kPairs; ++p) {
    for (std::size_t half = 0; half < 2; ++half) {
      const Lane& lane = *lanes[2 * p + half];
      const DistributionSummary& summary = lane.counter->summary;
      samples[2 * p + half] = lane.samples;
      minimum[p][half] = summary.minimum;
      maximum[p][half] = summary.maximum;
      mean[p][half] = summary.mean;
      squared[p][half] = summary.squaredDeviations;
    }
  }
  for (std::size_t i = from; i < to; ++i) {
    const double count = static_cast<double>(i + 1);
    for (std::size_t p = 0; p < kPairs; ++p) {
      const Pair sample = {samples[2 * p][i], samples[2 * p + 1][i]};
      const Pair delta = sample - mean[p];
      mean[p] += delta / count;
      squared[p] += delta * (sample - mean[p]);
      minimum[p] = sample < minimum[p] ? sample : minimum[p];
      maximum[p] = sample > maximum[p] ? sample : maximum[p];
    }
  }
  for (std::size_t p = 0; p < kPairs; ++p) {
    for (std::size_t half = 0; half < 2; ++half) {
      lanes[2 * p + half]->counter->summary = {minimum[p][half], maximum[p][half], mean[p][half],
                                               squared[p][half], static_cast<std::int64_t>(to)};
    }
  }
}

template <std::size_t kPairs>
void addSideBySide(const Lane* const* lanes, std::size_t from, std::size_t to) {
  for (; from < to; from = std::min(to, from + kBlock)) {
    const std::size_t end = std::min(to, from + kBlock);
    addPairs<kPairs>(lanes, from, end);
    for (std::size_t lane = 0; lane < 2 * kPairs; ++lane) {
      lanes[lane]->counter->addToHistogram({lanes[lane]->samples + from, end - from});
    }
  }
}

// One step of all lanes, in groups as wide as there are lanes for.
void addTo(std::span<const Lane* const> lanes, std::size_t from, std::size_t to) {
  while (!lanes.empty()) {
    const std::size_t width = std::bit_floor(lanes.size());
    const Lane* const* const group = lanes.data();
    switch (width) {
      case 8:
        addSideBySide<4>(group, from, to);
        break;
      case 4:
        addSideBySide<2>(group, from, to);
        break;
      case 2:
        addSideBySide<1>(group, from, to);
        break;
      default:
        (*group)->counter->add({(*group)->samples + from, to - from}, {});
    }
    lanes = lanes.subspan(width);
  }
}
static_assert(DistributionPass::kSideBySide == 8);

// The lanes by their number of samples, the shortest first; each has one.
void summarise(std::span<const Lane* const> lanes) {
  for (const Lane* lane : lanes) lane->counter->add({lane->samples, 1}, {});
  for (std::size_t done = 1; !lanes.empty(); lanes = lanes.subspan(1)) {
    const std::size_t next = lanes.front()->count;
    if (next > done) addTo(lanes, done, next);
    done = next;
  }
}

}  // namespace

bool DistributionPass::keep(Kept& kept, DistributionValues& values) {
  DistributionCounter& counter = *kept.counter;
  std::size_t count = 0;
  while ((count = values.nextValues(&kept.samples[kept.count], nullptr, kMostKept - kept.count)) >
         0) {
    if (const auto weights = values.weights(); !weights.empty()) {
      counter.add({kept.samples.get(), kept.count}, {});
      counter.add({&kept.samples[kept.count], count}, weights);
      break;
    }
    kept.count += count;
    if (kept.count < kMostKept) continue;
    counter.add({kept.samples.get(), kept.count}, {});
    break;
  }
  if (count == 0) return true;
  while ((count = values.nextValues(kept.samples.get(), nullptr, kBlock)) > 0) {
    counter.add({kept.samples.get(), count}, values.weights());
  }
  kept.count = 0;
  return false;
}

void DistributionPass::add(DistributionValues& values, std::string_view key,
                           const ScalarOptions& options) {
  Kept& kept = kept_[used_++];
  if (!kept.samples) kept.samples = std::make_unique_for_overwrite<double[]>(kMostKept);
  kept.key = key;
  kept.count = 0;
  kept.counter.emplace(log_, key, options);
  if (!keep(kept, values) || used_ == kSideBySide) deliver();
}

void DistributionPass::deliver() {
  std::array<Lane, kSideBySide> lanes;
  std::vector<const Lane*> order;  // the shortest first
  order.reserve(kSideBySide);
  for (std::size_t i = 0; i < used_; ++i) {
    lanes[i] = {kept_[i].samples.get(), kept_[i].count, &*kept_[i].counter};
    if (kept_[i].count == 0) continue;
    order.insert(std::ranges::upper_bound(order, kept_[i].count, {}, &Lane::count), &lanes[i]);
  }
  summarise(order);
  for (std::size_t i = 0; i < used_; ++i) {
    receiver_(kept_[i].key, kept_[i].counter->result());
    kept_[i].counter.reset();
  }
  used_ = 0;
}

}  // namespace tally
