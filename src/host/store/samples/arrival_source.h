// The samples of the table `arrivals`.
#pragma once

#include <memory>

#include "host/store/samples/sample_source.h"
#include "host/store/store_rows.h"

namespace tally {

// Rows lie in the order of their arrival; they are put into the order of day and key in memory.
// Never null; all arguments are borrowed.
std::unique_ptr<SampleSource> openArrivals(Database& database, StoreFaults& faults,
                                           const StoreRange& range,
                                           const HistoryStore::KeyFilter& wanted);

}  // namespace tally
