// Rounding of scalars, as the whitelist's options ask for it.
#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "config/scalar_options.h"

namespace tally {

// One step of a rounding, for those who want to follow it.
struct RoundingStep {
  std::string_view option;  // kOptionBucketInterval or kOptionSignificantFigures
  std::uint32_t setting = 0;
  std::int64_t before = 0;
  std::int64_t after = 0;
};

// The value rounded to a multiple of "bucket_interval", then to "sig_fig" significant figures.
// A bucket interval of 0 skips its step; results outside 64 bits saturate. Steps that were applied
// are added to steps when it is given.
std::int64_t roundScalar(std::int64_t value, const ScalarOptions& options,
                         std::vector<RoundingStep>* steps = nullptr);

}  // namespace tally
