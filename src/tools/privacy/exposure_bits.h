// How many bits of information a report can have.
#pragma once

#include <cstdint>
#include <span>
#include <vector>

#include "config/whitelist_options.h"

namespace tally::tools {

// What was seen of a distribution.
struct SampleFacts {
  double minimum = 0, maximum = 0;
  std::int64_t mostSamples = 0;  // of a day
  bool whole = true;             // all samples are whole numbers
};

// Of one scalar between the two, under its options: log2 of the number of different outputs.
double scalarBits(std::int64_t lowest, std::int64_t highest, const ScalarOptions& options);

// Of one day's distribution at most: its count, minimum, maximum, mean and squared deviations, and
// the counts of so many buckets, none without a histogram. Never more than the samples have.
double distributionBits(const SampleFacts& samples, std::size_t buckets);

// Upper bounds that rise; those of an "intervals" option that no sample can reach are left out.
std::vector<double> risingBounds(const ScalarOptions& options);
// How many of the buckets between the bounds some value from minimum to maximum falls in.
std::size_t bucketsReached(std::span<const double> bounds, double minimum, double maximum);

}  // namespace tally::tools
