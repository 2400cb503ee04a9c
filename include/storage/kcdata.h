// I/O statistics of a thread in kcdata, the format of stackshots.
#pragma once

#include <cstddef>
#include <span>

#include "kv/export.h"

namespace tally {

// Searches kcdata for the first container with a thread of that name. 1 with its I/O statistics
// (no bytes, null, when it has none), or 0. Nothing outside [begin, end) is read; containers nested
// deeper than any thread's are not followed and end the search.
TALLY_API int getIOStatsWithThreadnameFromKCData(const std::byte* begin, const std::byte* end,
                                                 const char* threadName,
                                                 std::span<const std::byte>* ioStatsOut);
// The same in the first container alone, including all that is nested in it. *positionOut, when
// given, is where the search stopped; null when the data ended first.
TALLY_API int getIOStatsWithThreadnameFromKCDataHelper(const std::byte* begin, const std::byte* end,
                                                       const char* threadName,
                                                       std::span<const std::byte>* ioStatsOut,
                                                       const std::byte** positionOut);

}  // namespace tally
