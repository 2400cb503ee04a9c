// The days that the store's tables hold.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <vector>

#include "host/store/sqlite_database.h"

namespace tally {

// The days that hold data, from the newest on; of more the newest. Takes one look-up in the tables
// for each day, however many rows it has; but new samples of the recorder are read through.
Result<std::vector<std::int32_t>> daysOfStore(Database& database, std::size_t most);

// Removes all that belongs to the days for which the comparison with the day holds ("< ?1").
// REQUIRES: a transaction.
Status forgetDaysOfStore(Database& database, std::string_view comparison, std::int32_t day);

}  // namespace tally
