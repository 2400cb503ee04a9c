// How many different values a rounding can report.
#pragma once

#include <cstdint>

#include "config/whitelist_options.h"

namespace tally {

// The number of different results that roundScalar has for the values from lowest to highest.
// Exact as long as the values and the number have at most 15 digits, and close above. The time does
// not depend on the distance. REQUIRES: lowest <= highest.
double outputsBetween(std::int64_t lowest, std::int64_t highest, const ScalarOptions& options);

}  // namespace tally
