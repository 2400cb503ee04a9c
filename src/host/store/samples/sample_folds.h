// Moves new samples to the table in which each key's samples lie together.
#pragma once

#include <chrono>

#include "host/store/samples/sample_tail.h"

namespace tally {

// Goes on until the time is up, but for one row at least; false when there may be more. Damaged
// rows stay where they are. REQUIRES: a transaction, and the table of arrivals.
Result<bool> foldArrivals(Database& database, SampleTail& tail,
                          std::chrono::steady_clock::time_point end);

}  // namespace tally
