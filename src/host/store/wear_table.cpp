#include "host/store/wear_table.h"

#include <algorithm>
#include <optional>

#include "host/store/store_schema.h"

namespace tally {
namespace {

// Of a disk: two a week for forty years.
constexpr std::size_t kMostRows = 4096;
constexpr std::int64_t kMostPercent = 1000;

std::optional<std::int64_t> count(const Statement& row, int column) {
  const bool isCount = row.type(column) == ColumnType::Integer && row.integer(column) >= 0;
  return isCount ? std::optional(row.integer(column)) : std::nullopt;
}

std::optional<WearRow> parseRow(const Statement& row) {
  const auto day = count(row, 0), least = count(row, 1), most = count(row, 2);
  if (!day || *day > INT32_MAX || !least || *least > kMostPercent) return std::nullopt;
  if (most && (*most < *least || *most > kMostPercent)) return std::nullopt;
  WearRow wear;
  wear.day = static_cast<std::int32_t>(*day);
  wear.used.least = static_cast<unsigned>(*least);
  if (most) wear.used.most = static_cast<unsigned>(*most);
  wear.hostBytes = count(row, 3);
  wear.flashBytes = count(row, 4);
  return wear;
}

}  // namespace

Result<std::vector<WearRow>> readWear(Database& database, std::string_view disk) {
  std::vector<WearRow> rows;
  const auto exists = hasTable(database, kWearTable);
  if (!exists) return exists.error();
  if (!*exists) return rows;
  auto query = database.prepare(
      "SELECT day, least, most, host_bytes, flash_bytes FROM wear WHERE disk = ?1 "
      "ORDER BY day DESC");
  if (!query) return query.error();
  query->bind(1, disk);
  Step step = Step::Row;
  for (std::size_t looks = 0; looks < kMostRows && step == Step::Row; ++looks) {
    step = query->step();
    const auto row = step == Step::Row ? parseRow(*query) : std::nullopt;
    // Days fall, unless the file is damaged.
    if (row && (rows.empty() || row->day < rows.back().day)) rows.push_back(*row);
  }
  if (step == Step::Failed) return database.error();
  std::ranges::reverse(rows);
  return rows;
}

Status writeWear(Database& database, std::string_view disk, const WearRow& row) {
  if (auto made = makeOptionalTable(database, kWearTable); !made) return made;
  auto put = database.prepare("INSERT OR REPLACE INTO wear VALUES (?1, ?2, ?3, ?4, ?5, ?6)");
  if (!put) return put.error();
  // What is not bound is absent.
  put->bind(1, disk).bind(2, std::int64_t{row.day}).bind(3, std::int64_t{row.used.least});
  if (row.used.most) put->bind(4, std::int64_t{*row.used.most});
  if (row.hostBytes) put->bind(5, *row.hostBytes);
  if (row.flashBytes) put->bind(6, *row.flashBytes);
  return put->run() ? Status(Done{}) : database.error();
}

}  // namespace tally
