// Reads the counters that the store keeps.
#pragma once

#include <vector>

#include "host/store/store_schema.h"
#include "platform/counters/counter_state.h"

namespace tally {

// None when there is no store, or nothing was kept. A damaged row is left out.
Result<std::vector<CounterState>> readCounterStates(const StoreFile& file);

}  // namespace tally
