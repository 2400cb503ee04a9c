// Coarser options, and the error that they make.
#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "tools/privacy/exposure.h"

namespace tally::tools {

// The samples of all keys and days of an entry, by bucket.
struct BucketTotals {
  std::vector<double> bounds;          // rising
  std::vector<std::uint64_t> samples;  // of each bucket; one more than the bounds
  std::uint64_t distributions = 0;     // that were added up
};

// For an entry of scalars that decides these keys.
std::vector<PrivacyProposal> proposalsForScalars(const EntryExposure& entry,
                                                 std::span<const KeyExposure* const> keys);
// For an entry with a histogram: its buckets merged until a day's distribution has several samples
// in each, and no histogram at all.
std::vector<PrivacyProposal> proposalsForHistogram(const EntryExposure& entry,
                                                   std::span<const KeyExposure* const> keys,
                                                   const BucketTotals& totals);

}  // namespace tally::tools
