// Turns a store of schema version 1 into one of version 2.
#pragma once

#include "host/store/sqlite_database.h"
#include "host/store/store_history.h"

namespace tally {

// Moves the samples of `chunks`, `recent` and `packed` to `series`, in one transaction of its own:
// a kill or a full disk leaves the store as it was. Memory does not grow with their number. Damaged
// rows go, with one line to onFault that counts them; a file that cannot be read to its end is not
// converted. Done at once if the store has version 2. REQUIRES: a connection that may write, with
// no transaction and no running statement.
Status convertToPackedSchema(Database& database, const StoreFaultHandler& onFault);

}  // namespace tally
