#include "host/store/store_days.h"

#include <algorithm>
#include <limits>
#include <string>

#include "host/store/store_schema.h"

namespace tally {
namespace {

struct DayTable {
  std::string_view name;
  bool isOptional = false;
  bool isData = true;  // else what is there only beside data
};
constexpr DayTable kDayTables[] = {
    {"scalars"},
    {"chunks"},
    {"recent"},
    {kPackedTable, true},
    {kArrivalsTable, true},
    {kOwnersTable, true, false},
};

Result<std::vector<DayTable>> presentTables(Database& database) {
  std::vector<DayTable> present;
  for (const DayTable& table : kDayTables) {
    const auto exists = table.isOptional ? hasTable(database, table.name) : Result<bool>(true);
    if (!exists) return exists.error();
    if (*exists) present.push_back(table);
  }
  return present;
}

}  // namespace

Result<std::vector<std::int32_t>> daysOfStore(Database& database, std::size_t most) {
  const auto tables = presentTables(database);
  if (!tables) return tables.error();
  std::string newest;
  for (const DayTable& table : *tables) {
    if (!table.isData) continue;
    newest +=
        (newest.empty() ? "SELECT max(day) AS day FROM " : " UNION ALL SELECT max(day) FROM ") +
        std::string(table.name) + " WHERE day < ?1";
  }
  auto query = database.prepare("SELECT max(day) FROM (" + newest + ")");
  if (!query) return query.error();
  using Limits = std::numeric_limits<std::int32_t>;
  std::vector<std::int32_t> found;
  std::int64_t before = std::int64_t{Limits::max()} + 1;
  while (found.size() < most && before > Limits::min()) {
    if (query->bind(1, before).step() != Step::Row) return database.error();
    if (query->type(0) == ColumnType::Null) break;
    // A damaged row's day may be a real, which is cut to a whole number that is not below it.
    before = std::min(query->integer(0), before - 1);
    query->reset();
    if (before >= Limits::min()) found.push_back(static_cast<std::int32_t>(before));
  }
  return found;
}

Status forgetDaysOfStore(Database& database, std::string_view comparison, std::int32_t day) {
  const auto tables = presentTables(database);
  if (!tables) return tables.error();
  for (const DayTable& table : *tables) {
    auto statement = database.prepare("DELETE FROM " + std::string(table.name) + " WHERE day " +
                                      std::string(comparison));
    if (!statement) return statement.error();
    if (!statement->bind(1, std::int64_t{day}).run()) return database.error();
  }
  return Done{};
}

}  // namespace tally
