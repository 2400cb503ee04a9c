// What the recorder writes, in the SQLite store.
#pragma once

#include <memory>

#include "host/store/store_schema.h"
#include "platform/recording/recording_store.h"

namespace tally {

// Nothing is opened before it is used. The connection then stays open, since closing the last one
// folds the write-ahead log into the file; one to a file that was removed or replaced is given up.
// Not for use from two threads at once.
std::shared_ptr<RecordingStore> makeSqliteRecordingStore(StoreFile file);

}  // namespace tally
