// The table of the store in which the wear of disks is kept.
#pragma once

#include <string_view>
#include <vector>

#include "host/store/sqlite_database.h"
#include "platform/flash/wear_history.h"

namespace tally {

// The newest rows of the disk, oldest first; none where the store has no such table. Damaged rows
// are left out.
Result<std::vector<WearRow>> readWear(Database& database, std::string_view disk);

// REQUIRES: a transaction.
Status writeWear(Database& database, std::string_view disk, const WearRow& row);

}  // namespace tally
