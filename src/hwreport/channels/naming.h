// Names of channels, and those that are packed into a 64-bit id.
#pragma once

#include <cstdint>

#include "kv/value.h"

namespace tally {

// The id's bytes from the most significant on, zeros left out. Null when one is not printable
// ASCII or none is left.
KvRef<KvString> nameOfID(std::uint64_t id);

// The name of a legend's channel array, or else of its id. Null when there is none.
KvRef<KvString> nameOfLegend(const KvArray* legend);

}  // namespace tally
