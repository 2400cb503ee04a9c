#include "tools/privacy/exposure_bits.h"

#include <algorithm>
#include <bit>
#include <cmath>
#include <numbers>

#include "config/rounding_outputs.h"
#include "kv/value.h"

namespace tally::tools {
namespace {

constexpr double kBitsOfDouble = 64;

// The place of a double among all of them, in their order.
std::int64_t orderOf(double value) {
  const auto bits = std::bit_cast<std::int64_t>(value + 0.0);  // -0 is 0
  return bits >= 0 ? bits : std::int64_t(std::uint64_t{1} << 63) - bits;
}

// log2 of how many doubles, or whole numbers, there are from one to the other.
double bitsBetween(double lowest, double highest, bool whole) {
  if (!(highest > lowest)) return 0;
  const double between =
      whole ? std::floor(highest) - std::ceil(lowest)
            : static_cast<double>(orderOf(highest)) - static_cast<double>(orderOf(lowest));
  return std::min(std::log2(between + 1), kBitsOfDouble);
}

// log2 of the number of ways to choose so many of `kinds` kinds, in no order; 2^kindBits is
// `kinds`.
double bitsOfChoice(double chosen, double kindBits) {
  if (chosen <= 0 || kindBits <= 0) return 0;
  const double kinds = std::exp2(kindBits);
  constexpr double kFar = 1e6;
  if (kinds > kFar * chosen) {  // the difference of the logarithms would be lost
    return chosen * kindBits - std::lgamma(chosen + 1) * std::numbers::log2e;
  }
  const double natural = std::lgamma(chosen + kinds) - std::lgamma(chosen + 1) - std::lgamma(kinds);
  return std::max(natural * std::numbers::log2e, 0.0);
}

}  // namespace

double scalarBits(std::int64_t lowest, std::int64_t highest, const ScalarOptions& options) {
  return std::log2(outputsBetween(lowest, highest, options));
}

double distributionBits(const SampleFacts& samples, std::size_t buckets) {
  const auto count = static_cast<double>(samples.mostSamples);
  if (count <= 0) return 0;
  const double range = samples.maximum - samples.minimum;
  const double sampleBits = bitsBetween(samples.minimum, samples.maximum, samples.whole);
  // With whole samples, the sum is whole as well, and so is that of their squares.
  const double meanBits =
      samples.whole ? std::min(std::log2(count * range + 1), kBitsOfDouble) : sampleBits;
  const double deviationBits = bitsBetween(0, count * range * range / 4, samples.whole);
  const double histogramBits =
      buckets > 1 ? bitsOfChoice(count, std::log2(static_cast<double>(buckets))) : 0;
  const double statistics = 2 * sampleBits + meanBits + deviationBits;
  return std::log2(count + 1) +
         std::min(statistics + histogramBits, bitsOfChoice(count, sampleBits));
}

std::vector<double> risingBounds(const ScalarOptions& options) {
  std::vector<double> bounds;
  const auto* const array = options.getAs<KvArray>(kOptionIntervals);
  for (std::size_t i = 0; array != nullptr && i < array->size(); ++i) {
    const auto* const number = array->getAs<KvNumber>(i);
    const double bound = number != nullptr ? number->asDouble() : std::nan("");
    if (!std::isnan(bound) && (bounds.empty() || bound > bounds.back())) bounds.push_back(bound);
  }
  return bounds;
}

std::size_t bucketsReached(std::span<const double> bounds, double minimum, double maximum) {
  const auto bucketOf = [&](double value) {
    return std::ranges::lower_bound(bounds, value) - bounds.begin();
  };
  return static_cast<std::size_t>(bucketOf(maximum) - bucketOf(minimum)) + 1;
}

}  // namespace tally::tools
