#include "host/store/store_days.h"

#include <algorithm>
#include <limits>
#include <string>

#include "host/store/store_schema.h"

namespace tally {
namespace {

constexpr std::string_view kDayTables[] = {"scalars",    kChunksTable,   kRecentTable, kPackedTable,
                                           kSeriesTable, kArrivalsTable, kOwnersTable};
// Owners are there only beside data.
constexpr auto kDataTables = std::span(kDayTables).first<std::size(kDayTables) - 1>();

}  // namespace

Result<std::vector<std::int32_t>> daysOfStore(Database& database, std::size_t most) {
  const auto tables = presentTables(database, kDataTables);
  if (!tables) return tables.error();
  std::string newest;
  for (const std::string_view table : *tables) {
    newest +=
        (newest.empty() ? "SELECT max(day) AS day FROM " : " UNION ALL SELECT max(day) FROM ") +
        std::string(table) + " WHERE day < ?1";
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
  const auto tables = presentTables(database, kDayTables);
  if (!tables) return tables.error();
  for (const std::string_view table : *tables) {
    auto statement = database.prepare("DELETE FROM " + std::string(table) + " WHERE day " +
                                      std::string(comparison));
    if (!statement) return statement.error();
    if (!statement->bind(1, std::int64_t{day}).run()) return database.error();
  }
  return Done{};
}

}  // namespace tally
