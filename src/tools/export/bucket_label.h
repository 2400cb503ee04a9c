// The labels of histogram buckets, read back.
#pragma once

#include <optional>
#include <string_view>

namespace tally::tools {

// A bucket holds the samples above `lower` and up to `upper`; the infinities are open ends.
struct BucketBounds {
  double lower, upper;
};

// The bounds of a label as a log has it: "(-inf, 10]", "(10, 20]", "(20, inf)". A bound may be any
// real, since a whitelist may hold any. Empty when the text is not a label.
std::optional<BucketBounds> parseBucketLabel(std::string_view label);

}  // namespace tally::tools
