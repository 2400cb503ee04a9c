// The table of changes whose day was not known when they were recorded.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

#include "host/store/sqlite_database.h"
#include "platform/recording/recording_store.h"

namespace tally {

// As the functions of RecordingTransaction. REQUIRES: a transaction; keys of the store. Damaged
// rows are left out, and forgotten as all are.
Status addUndatedChange(Database& database, std::string_view boot, std::int64_t secondsSinceBoot,
                        const RecordedChange& change);
Result<std::vector<UndatedChange>> takeUndatedChanges(Database& database, std::string_view boot,
                                                      std::size_t most);
Result<std::uint64_t> forgetUndatedChanges(Database& database, std::optional<std::int32_t> today);

}  // namespace tally
