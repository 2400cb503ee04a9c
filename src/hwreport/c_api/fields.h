// What a channel tells about itself, by the constants of hwreport_c.h.
#pragma once

#include <cstdint>

#include "kv/value.h"

namespace tally {

// Null when there is no field of that constant. A reader gives null, or the invalid marker, when
// the channel does not have it.
using CTextReader = KvString* (*)(KvDictionary* channel);
CTextReader textReaderOf(int field) noexcept;
using CNumberReader = std::uint64_t (*)(KvDictionary* channel);
CNumberReader numberReaderOf(int field) noexcept;

}  // namespace tally
