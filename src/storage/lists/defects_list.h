// The defects list: how many defects the factory found, and each one found since.
#pragma once

#include "storage/lists/storage_lists.h"
#include "storage/lists/telemetry_list.h"

namespace tally {

// Hands the records of a defects list to the sink: a summary, and each defect. A record that is not
// wholly inside the list is left out; then a line is printed and the result is false.
bool readDefectsList(const StorageList& list, const RecordSink& sink);

}  // namespace tally
