// Moves new samples to the tables in which each key's samples lie together.
#pragma once

#include <chrono>

#include "host/store/samples/sample_tail.h"

namespace tally {

// Both go on until the time is up, but for one row at least; false when there may be more. Damaged
// rows stay where they are. REQUIRES: a transaction, and a tail of chunks, or of packed rows.
Result<bool> foldRecent(Database& database, SampleTail& chunks,
                        std::chrono::steady_clock::time_point end);
Result<bool> foldArrivals(Database& database, SampleTail& packed,
                          std::chrono::steady_clock::time_point end);

}  // namespace tally
