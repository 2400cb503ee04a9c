// Sums over the states of a channel.
#pragma once

#include <cstdint>
#include <optional>

#include "kv/value.h"

namespace tally {

// The sum of all residencies. Empty when a state cannot be read or the sum is 0.
std::optional<std::uint64_t> totalResidency(const KvDictionary* channel);
// A residency's share of the total; NaN when there is none.
double dutyCycle(std::uint64_t residency, std::optional<std::uint64_t> total);

}  // namespace tally
