// The tables of samples that only stores of schema version 1 have.
#pragma once

#include <memory>
#include <vector>

#include "host/store/samples/sample_source.h"
#include "host/store/store_rows.h"

namespace tally {

// Appends the sources of chunks, recent and packed, without those that the store lacks. All
// arguments are borrowed.
void openFormerSources(Database& database, StoreFaults& faults, const StoreRange& range,
                       bool filtered, std::vector<std::unique_ptr<SampleSource>>& sources);

}  // namespace tally
