#include "host/store/recording/undated_table.h"

#include <string>

#include "host/store/samples/packed_samples.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

constexpr std::int64_t kDaysWaiting = 30;
constexpr std::int64_t kMostBytes = 8 << 20;
constexpr std::int64_t kLongestBoot =
    std::int64_t{100} * 366 * 86400;       // seconds: nothing runs so long
constexpr std::int64_t kBytesOfRow = 128;  // beside its samples and its key

using ChangeKind = RecordedChange::Kind;
// As the column says it; never renumbered.
constexpr struct {
  ChangeKind kind;
  std::int64_t number;
} kKinds[] = {
    {ChangeKind::Add, 0}, {ChangeKind::Set, 1}, {ChangeKind::Samples, 2}, {ChangeKind::Move, 3}};

std::int64_t numberOf(ChangeKind kind) {
  for (const auto& entry : kKinds) {
    if (entry.kind == kind) return entry.number;
  }
  return -1;
}

// Columns from the first on: seconds, kind, key, value, user, data.
std::optional<UndatedChange> parseChange(const Statement& row, int first) {
  UndatedChange change;
  const std::string_view key = row.text(first + 2);
  for (const int column : {first, first + 1, first + 3, first + 4}) {
    if (row.type(column) != ColumnType::Integer) return std::nullopt;
  }
  if (!isStoreKey(key)) return std::nullopt;
  bool known = false;
  for (const auto& entry : kKinds) {
    if (entry.number != row.integer(first + 1)) continue;
    change.kind = entry.kind;
    known = true;
  }
  if (!known) return std::nullopt;
  change.key = key;
  change.secondsSinceBoot = row.integer(first);
  if (change.secondsSinceBoot < 0 || change.secondsSinceBoot > kLongestBoot) return std::nullopt;
  change.value = row.integer(first + 3);
  change.user = row.integer(first + 4);
  if (change.kind != ChangeKind::Samples) return change;
  SampleVectors samples;
  if (!unpackSamples(row.blob(first + 5), PackedColumns::All, samples)) return std::nullopt;
  change.values = std::move(samples.values);
  change.offsets = std::move(samples.offsets);
  change.weights = std::move(samples.weights);
  return change;
}

// The newest row that goes when the oldest go, until the others take little enough; empty when none
// has to.
Result<std::optional<std::int64_t>> lastToForget(Database& database) {
  auto rows = database.prepare(
      "SELECT number, coalesce(length(data), 0) + length(CAST(key AS BLOB)) FROM undated "
      "ORDER BY number DESC");
  if (!rows) return rows.error();
  std::int64_t bytes = 0;
  Step step = Step::Done;
  while ((step = rows->step()) == Step::Row) {
    bytes += kBytesOfRow + rows->integer(1);
    if (bytes > kMostBytes) return std::optional(rows->integer(0));
  }
  if (step == Step::Failed) return database.error();
  return std::optional<std::int64_t>();
}

}  // namespace

Status addUndatedChange(Database& database, std::string_view boot, std::int64_t secondsSinceBoot,
                        const RecordedChange& change) {
  if (auto made = makeOptionalTable(database, kUndatedTable); !made) return made;
  auto add =
      database.prepare("INSERT INTO undated VALUES (NULL, ?1, ?2, ?3, ?4, ?5, ?6, ?7, NULL)");
  if (!add) return add.error();
  add->bind(1, boot)
      .bind(2, secondsSinceBoot)
      .bind(3, numberOf(change.kind))
      .bind(4, change.key)
      .bind(5, change.value)
      .bind(7, change.user);
  if (change.kind != ChangeKind::Samples) return add->run() ? Status(Done{}) : database.error();
  for (std::size_t first = 0; first < change.samples.values.size(); first += kMostPackedSamples) {
    const auto blob = packSamples(slice(change.samples, first, kMostPackedSamples));
    if (!add->bind(6, std::span(blob)).run()) return database.error();
  }
  return Done{};
}

Result<std::vector<UndatedChange>> takeUndatedChanges(Database& database, std::string_view boot,
                                                      std::size_t most) {
  std::vector<UndatedChange> taken;
  const auto exists = hasTable(database, kUndatedTable);
  if (!exists) return exists.error();
  if (!*exists) return taken;
  auto rows =
      database.prepare("SELECT number, seconds, kind, key, value, user, " +
                       std::string(kBoundedBlob) + " FROM undated WHERE boot = ?1 ORDER BY number");
  if (!rows) return rows.error();
  auto remove = database.prepare("DELETE FROM undated WHERE number = ?1");
  if (!remove) return remove.error();
  rows->bind(1, boot);
  std::vector<std::int64_t> numbers;
  Step step = Step::Done;
  std::optional<std::int64_t> last;
  while (taken.size() < most && (step = rows->step()) == Step::Row) {
    const std::int64_t number = rows->integer(0);
    if (last && number <= *last) return damagedTree(database);
    last = number;
    auto change = parseChange(*rows, 1);
    if (!change) continue;
    taken.push_back(*std::move(change));
    numbers.push_back(number);
  }
  if (step == Step::Failed) return database.error();
  rows->reset();
  for (const std::int64_t number : numbers) {
    if (!remove->bind(1, number).run()) return database.error();
  }
  return taken;
}

Result<std::uint64_t> forgetUndatedChanges(Database& database, std::optional<std::int32_t> today) {
  const auto exists = hasTable(database, kUndatedTable);
  if (!exists) return exists.error();
  std::uint64_t forgotten = 0;
  if (!*exists) return forgotten;
  const auto run = [&](const char* text, std::int64_t number) -> Status {
    auto statement = database.prepare(text);
    if (!statement) return statement.error();
    return statement->bind(1, number).run() ? Status(Done{}) : database.error();
  };
  if (today) {
    // A later day than today was counted from under a wrong clock.
    auto counted =
        run("UPDATE undated SET first_day = ?1 WHERE first_day IS NULL OR first_day > ?1", *today);
    if (!counted) return counted.error();
    auto removed = run("DELETE FROM undated WHERE first_day <= ?1", *today - kDaysWaiting);
    if (!removed) return removed.error();
    forgotten += static_cast<std::uint64_t>(database.changes());
  }
  const auto last = lastToForget(database);
  if (!last) return last.error();
  if (*last) {
    auto removed = run("DELETE FROM undated WHERE number <= ?1", **last);
    if (!removed) return removed.error();
    forgotten += static_cast<std::uint64_t>(database.changes());
  }
  return forgotten;
}

}  // namespace tally
