#include "host/store/store_writer.h"

#include <algorithm>
#include <limits>
#include <vector>

#include "host/store/samples/sample_chunk.h"
#include "host/store/samples/sample_folds.h"
#include "host/store/store_days.h"
#include "host/store/store_rows.h"
#include "host/store/wear_table.h"

namespace tally {
namespace {

// No clock makes so many, but a damaged file may hold one for each row.
constexpr std::size_t kMostDaysListed = 4096;

}  // namespace

Result<std::optional<StoreWriter>> StoreWriter::open(const StoreFile& file, IfMissing ifMissing) {
  auto opened = openStoreForWriting(file, ifMissing);
  if (!opened) return opened.error();
  if (!*opened) return std::optional<StoreWriter>();
  Database& database = **opened;
  Statements statements;
  const struct {
    Statement& statement;
    std::string_view text;
  } kTexts[] = {
      {statements.setScalar, "INSERT OR REPLACE INTO scalars VALUES (?1, ?2, ?3)"},
      {statements.lastRecent, "SELECT max(number) FROM recent WHERE day = ?1 AND key = ?2"},
      {statements.addRecent, "INSERT INTO recent VALUES (?1, ?2, ?3, ?4, ?5, ?6)"},
  };
  for (const auto& entry : kTexts) {
    auto prepared = database.prepare(entry.text);
    if (!prepared) return prepared.error();
    entry.statement = std::move(*prepared);
  }
  return std::optional(
      StoreWriter(std::make_unique<Database>(std::move(database)), std::move(statements)));
}

Status StoreWriter::begin() {
  // The transaction before may have been undone, with the table that it made.
  packed_.reset();
  hasPacked_.reset();
  return database_->execute("BEGIN IMMEDIATE");
}

Status StoreWriter::commit() {
  auto committed = database_->execute("COMMIT");
  if (!committed) rollBack();
  return committed;
}

void StoreWriter::rollBack() { (void)database_->execute("ROLLBACK"); }

Status StoreWriter::checkKey(std::string_view key) const {
  if (isStoreKey(key)) return Done{};
  return database_->error(kStoreKeyRule);
}

Status StoreWriter::setScalar(std::int32_t day, std::string_view key, std::int64_t value) {
  if (auto valid = checkKey(key); !valid) return valid;
  const bool set =
      statements_.setScalar.bind(1, std::int64_t{day}).bind(2, key).bind(3, value).run();
  return set ? Status(Done{}) : database_->error();
}

Status StoreWriter::pushSamples(std::int32_t day, std::string_view key,
                                std::span<const double> values,
                                std::span<const std::uint32_t> offsets) {
  if (auto valid = checkKey(key); !valid) return valid;
  Statement& last = statements_.lastRecent;
  last.reset();
  if (last.bind(1, std::int64_t{day}).bind(2, key).step() != Step::Row) return database_->error();
  std::int64_t number = last.type(0) == ColumnType::Integer ? last.integer(0) : -1;
  last.reset();
  for (; !values.empty(); values = values.subspan(std::min(values.size(), kChunkSamples)),
                          offsets = offsets.subspan(std::min(offsets.size(), kChunkSamples))) {
    const std::size_t count = std::min(values.size(), kChunkSamples);
    if (number < -1 || ++number >= kMostRowsOfKey) {
      return database_->error("the new samples of " + std::string(key) +
                              " are numbered out of range");
    }
    const bool added = statements_.addRecent.bind(1, std::int64_t{day})
                           .bind(2, key)
                           .bind(3, number)
                           .bind(4, static_cast<std::int64_t>(count))
                           .bind(5, packValues(values.first(count)))
                           .bind(6, packOffsets(offsets.first(count)))
                           .run();
    if (!added) return database_->error();
  }
  return Done{};
}

Result<SampleTail*> StoreWriter::tail(SampleTail::Table table) {
  auto& tail = table == SampleTail::Table::Chunks ? chunks_ : packed_;
  if (!tail) {
    auto opened = SampleTail::open(*database_, table);
    if (!opened) return opened.error();
    tail = std::move(*opened);
  }
  return &*tail;
}

Result<bool> StoreWriter::isPacked(std::int32_t day, std::string_view key) {
  if (!hasPacked_) {
    const auto exists = hasTable(*database_, kPackedTable);
    if (!exists) return exists.error();
    hasPacked_ = *exists;
  }
  if (!*hasPacked_) return false;
  auto row = database_->prepare("SELECT 1 FROM packed WHERE day = ?1 AND key = ?2");
  if (!row) return row.error();
  const Step step = row->bind(1, std::int64_t{day}).bind(2, key).step();
  if (step == Step::Failed) return database_->error();
  return step == Step::Row;
}

Status StoreWriter::appendSamples(std::int32_t day, std::string_view key,
                                  const SampleColumns& samples) {
  if (auto valid = checkKey(key); !valid) return valid;
  const auto packed = samples.weights.empty() ? isPacked(day, key) : Result<bool>(true);
  if (!packed) return packed.error();
  const auto opened = tail(*packed ? SampleTail::Table::Packed : SampleTail::Table::Chunks);
  if (!opened) return opened.error();
  if (*packed) hasPacked_ = true;
  SampleTail& end = **opened;
  if (auto moved = end.moveTo(day, key); !moved) return moved;
  if (auto appended = end.append(samples); !appended) return appended;
  return end.finish();
}

Status StoreWriter::addWear(std::string_view disk, const WearRow& row) {
  if (auto valid = checkKey(disk); !valid) return valid;
  return writeWear(*database_, disk, row);
}

Status StoreWriter::foldRecent() {
  const auto folded = foldRecentUntil(std::chrono::steady_clock::time_point::max());
  return folded ? Status(Done{}) : folded.error();
}

Result<bool> StoreWriter::foldRecentUntil(std::chrono::steady_clock::time_point end) {
  const auto chunks = tail(SampleTail::Table::Chunks);
  if (!chunks) return chunks.error();
  const auto folded = tally::foldRecent(*database_, **chunks, end);
  if (!folded || !*folded) return folded;
  const auto mayArrive = hasTable(*database_, kArrivalsTable);
  if (!mayArrive) return mayArrive.error();
  if (!*mayArrive) return true;
  const auto packed = tail(SampleTail::Table::Packed);
  if (!packed) return packed.error();
  return foldArrivals(*database_, **packed, end);
}

Status StoreWriter::setCounter(const CounterState& state) {
  if (auto checked = checkKey(state.key); !checked) return checked;
  if (!setCounter_) {
    if (auto made = makeOptionalTable(*database_, kCountersTable); !made) return made;
    auto prepared = database_->prepare(
        "INSERT OR REPLACE INTO counters VALUES(?, ?, ?, ?, ?, iif(?, ?, NULL))");
    if (!prepared) return prepared.error();
    setCounter_ = std::move(*prepared);
  }
  const bool kept = setCounter_->bind(1, state.key)
                        .bind(2, state.epoch)
                        .bind(3, static_cast<std::int64_t>(state.last))
                        .bind(4, static_cast<std::int64_t>(state.sum))
                        .bind(5, std::int64_t{state.day})
                        .bind(6, std::int64_t{state.amount.has_value()})
                        .bind(7, state.amount.value_or(0))
                        .run();
  return kept ? Status(Done{}) : Status(database_->error());
}

Status StoreWriter::forgetCountersBefore(std::int32_t day) {
  return database_->execute(("DELETE FROM counters WHERE day < " + std::to_string(day)).c_str());
}

Status StoreWriter::forgetBefore(std::int32_t day) {
  return forgetDaysOfStore(*database_, "< ?1", day);
}

Status StoreWriter::forgetDay(std::int32_t day) {
  return forgetDaysOfStore(*database_, "= ?1", day);
}

Result<bool> StoreWriter::hasRecent() {
  const auto some = database_->integer("SELECT EXISTS(SELECT 1 FROM recent)");
  if (!some) return some.error();
  if (*some != 0) return true;
  const auto mayArrive = hasTable(*database_, kArrivalsTable);
  if (!mayArrive || !*mayArrive) return mayArrive;
  const auto arrivals = database_->integer("SELECT EXISTS(SELECT 1 FROM arrivals)");
  if (!arrivals) return arrivals.error();
  return *arrivals != 0;
}

Result<std::vector<std::int32_t>> StoreWriter::days() {
  return daysOfStore(*database_, kMostDaysListed);
}

Result<std::uint64_t> StoreWriter::usedBytes() {
  std::int64_t figures[3];
  const char* const kPragmas[] = {"PRAGMA page_count", "PRAGMA freelist_count", "PRAGMA page_size"};
  for (std::size_t i = 0; i < std::size(kPragmas); ++i) {
    const auto figure = database_->integer(kPragmas[i]);
    if (!figure) return figure.error();
    figures[i] = *figure;
  }
  return static_cast<std::uint64_t>(std::max<std::int64_t>(figures[0] - figures[1], 0)) *
         static_cast<std::uint64_t>(figures[2]);
}

}  // namespace tally
