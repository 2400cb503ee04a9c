#include "host/store/store_writer.h"

#include <algorithm>
#include <limits>
#include <vector>

#include "host/store/samples/sample_chunk.h"
#include "host/store/store_days.h"
#include "host/store/store_rows.h"
#include "host/store/wear_table.h"

namespace tally {
namespace {

// Far above what a day can hold; a number beyond it was not written by this program.
constexpr std::int64_t kMostChunks = std::numeric_limits<std::int32_t>::max();
// No clock makes so many, but a damaged file may hold one for each row.
constexpr std::size_t kMostDaysListed = 4096;

}  // namespace

// The last chunk of a key on a day, while samples are being appended to it.
class StoreWriter::ChunkTail {
 public:
  ChunkTail(Database& database, Statements& statements)
      : database_(database), statements_(statements) {}

  // Continues the key's last chunk if it has space, else starts a new one.
  Status moveTo(std::int32_t day, std::string_view key) {
    day_ = day;
    key_ = key;
    values_.clear();
    offsets_.clear();
    Statement& last = statements_.lastChunk;
    last.reset();
    const Step step = last.bind(1, std::int64_t{day}).bind(2, key).step();
    if (step == Step::Failed) return database_.error();
    number_ = 0;
    if (step == Step::Row) {
      const std::int64_t number = last.integer(0), samples = last.integer(1);
      const auto values = last.blob(2), offsets = last.blob(3);
      const bool hasRoom = samples < static_cast<std::int64_t>(kChunkSamples) &&
                           chunkIsSound(samples, std::ssize(values), std::ssize(offsets));
      number_ = hasRoom ? number : number + (number < kMostChunks ? 1 : 0);
      if (hasRoom) {
        values_.resize(static_cast<std::size_t>(samples));
        offsets_.resize(values_.size());
        unpackValues(values, 0, values_);
        unpackOffsets(offsets, 0, offsets_);
      }
    }
    last.reset();
    if (number_ < 0 || number_ >= kMostChunks) {
      return database_.error("the chunks of " + key_ + " are numbered out of range");
    }
    return Done{};
  }

  Status append(std::span<const double> values, std::span<const std::uint32_t> offsets) {
    while (!values.empty()) {
      const std::size_t count = std::min(values.size(), kChunkSamples - values_.size());
      values_.insert(values_.end(), values.begin(), values.begin() + std::ptrdiff_t(count));
      offsets_.insert(offsets_.end(), offsets.begin(), offsets.begin() + std::ptrdiff_t(count));
      values = values.subspan(count);
      offsets = offsets.subspan(count);
      if (values_.size() < kChunkSamples) break;
      if (auto written = write(); !written) return written;
      values_.clear();
      offsets_.clear();
      ++number_;
    }
    return Done{};
  }

  // Writes what has been taken up and not filled.
  Status finish() { return values_.empty() ? Status(Done{}) : write(); }

 private:
  Status write() {
    const bool written = statements_.putChunk.bind(1, std::int64_t{day_})
                             .bind(2, key_)
                             .bind(3, number_)
                             .bind(4, std::ssize(values_))
                             .bind(5, packValues(values_))
                             .bind(6, packOffsets(offsets_))
                             .run();
    return written ? Status(Done{}) : database_.error();
  }

  Database& database_;
  Statements& statements_;
  std::int32_t day_ = 0;
  std::string key_;
  std::int64_t number_ = 0;
  std::vector<double> values_;
  std::vector<std::uint32_t> offsets_;
};

Result<std::optional<StoreWriter>> StoreWriter::open(const StoreFile& file, IfMissing ifMissing) {
  auto opened = openStoreForWriting(file, ifMissing);
  if (!opened) return opened.error();
  if (!*opened) return std::optional<StoreWriter>();
  Database& database = **opened;
  Statements statements;
  const std::string lastChunk = "SELECT number, samples, " + std::string(kBoundedValues) + ", " +
                                std::string(kBoundedOffsets) +
                                " FROM chunks WHERE day = ?1 AND key = ?2 "
                                "ORDER BY number DESC LIMIT 1";
  const struct {
    Statement& statement;
    std::string_view text;
  } kTexts[] = {
      {statements.setScalar, "INSERT OR REPLACE INTO scalars VALUES (?1, ?2, ?3)"},
      {statements.lastRecent, "SELECT max(number) FROM recent WHERE day = ?1 AND key = ?2"},
      {statements.addRecent, "INSERT INTO recent VALUES (?1, ?2, ?3, ?4, ?5, ?6)"},
      {statements.lastChunk, lastChunk},
      {statements.putChunk, "INSERT OR REPLACE INTO chunks VALUES (?1, ?2, ?3, ?4, ?5, ?6)"},
  };
  for (const auto& entry : kTexts) {
    auto prepared = database.prepare(entry.text);
    if (!prepared) return prepared.error();
    entry.statement = std::move(*prepared);
  }
  return std::optional(StoreWriter(std::move(database), std::move(statements)));
}

Status StoreWriter::begin() { return database_.execute("BEGIN IMMEDIATE"); }

Status StoreWriter::commit() {
  auto committed = database_.execute("COMMIT");
  if (!committed) rollBack();
  return committed;
}

void StoreWriter::rollBack() { (void)database_.execute("ROLLBACK"); }

Status StoreWriter::checkKey(std::string_view key) const {
  if (isStoreKey(key)) return Done{};
  return database_.error(kStoreKeyRule);
}

Status StoreWriter::setScalar(std::int32_t day, std::string_view key, std::int64_t value) {
  if (auto valid = checkKey(key); !valid) return valid;
  const bool set =
      statements_.setScalar.bind(1, std::int64_t{day}).bind(2, key).bind(3, value).run();
  return set ? Status(Done{}) : database_.error();
}

Status StoreWriter::pushSamples(std::int32_t day, std::string_view key,
                                std::span<const double> values,
                                std::span<const std::uint32_t> offsets) {
  if (auto valid = checkKey(key); !valid) return valid;
  Statement& last = statements_.lastRecent;
  last.reset();
  if (last.bind(1, std::int64_t{day}).bind(2, key).step() != Step::Row) return database_.error();
  std::int64_t number = last.type(0) == ColumnType::Integer ? last.integer(0) : -1;
  last.reset();
  for (; !values.empty(); values = values.subspan(std::min(values.size(), kChunkSamples)),
                          offsets = offsets.subspan(std::min(offsets.size(), kChunkSamples))) {
    const std::size_t count = std::min(values.size(), kChunkSamples);
    if (number < -1 || ++number >= kMostChunks) {
      return database_.error("the new samples of " + std::string(key) +
                             " are numbered out of range");
    }
    const bool added = statements_.addRecent.bind(1, std::int64_t{day})
                           .bind(2, key)
                           .bind(3, number)
                           .bind(4, static_cast<std::int64_t>(count))
                           .bind(5, packValues(values.first(count)))
                           .bind(6, packOffsets(offsets.first(count)))
                           .run();
    if (!added) return database_.error();
  }
  return Done{};
}

Status StoreWriter::appendToChunks(std::int32_t day, std::string_view key,
                                   std::span<const double> values,
                                   std::span<const std::uint32_t> offsets) {
  if (auto valid = checkKey(key); !valid) return valid;
  ChunkTail tail(database_, statements_);
  if (auto moved = tail.moveTo(day, key); !moved) return moved;
  if (auto appended = tail.append(values, offsets); !appended) return appended;
  return tail.finish();
}

Status StoreWriter::addWear(std::string_view disk, const WearRow& row) {
  if (auto valid = checkKey(disk); !valid) return valid;
  return writeWear(database_, disk, row);
}

Status StoreWriter::foldRecent() {
  const auto folded = foldRecentUntil(std::chrono::steady_clock::time_point::max());
  return folded ? Status(Done{}) : folded.error();
}

Result<bool> StoreWriter::foldRecentUntil(std::chrono::steady_clock::time_point end) {
  auto rows = database_.prepare(
      "SELECT day, key, number, samples, " + std::string(kBoundedValues) + ", " +
      std::string(kBoundedOffsets) +
      " FROM recent WHERE day BETWEEN -2147483648 AND 2147483647 ORDER BY day, key, number");
  if (!rows) return rows.error();
  auto remove = database_.prepare("DELETE FROM recent WHERE day = ?1 AND key = ?2 AND number = ?3");
  if (!remove) return remove.error();
  ChunkTail tail(database_, statements_);
  bool started = false;
  std::int64_t day = 0;
  std::string key;
  std::vector<double> values;
  std::vector<std::uint32_t> offsets;
  Step step = Step::Done;
  RowOrder order;
  while ((step = rows->step()) == Step::Row) {
    const std::int64_t number = rows->integer(2), samples = rows->integer(3);
    const auto valueColumn = rows->blob(4), offsetColumn = rows->blob(5);
    const std::int64_t rowDay = rows->integer(0);
    const std::string_view rowKey = rows->text(1);
    if (!order.follows(*rows, rowDay, rowKey, number)) return damagedTree(database_);
    if (!isStoreKey(rowKey) ||
        !chunkIsSound(samples, std::ssize(valueColumn), std::ssize(offsetColumn))) {
      continue;
    }
    if (!started || day != rowDay || key != rowKey) {
      if (auto finished = tail.finish(); !finished) return finished.error();
      day = rowDay;
      key = rowKey;
      if (auto moved = tail.moveTo(static_cast<std::int32_t>(day), key); !moved) {
        return moved.error();
      }
      started = true;
    }
    values.resize(static_cast<std::size_t>(samples));
    offsets.resize(values.size());
    unpackValues(valueColumn, 0, values);
    unpackOffsets(offsetColumn, 0, offsets);
    if (auto appended = tail.append(values, offsets); !appended) return appended.error();
    if (!remove->bind(1, day).bind(2, key).bind(3, number).run()) return database_.error();
    if (std::chrono::steady_clock::now() >= end) break;
  }
  if (step == Step::Failed) return database_.error();
  if (auto finished = tail.finish(); !finished) return finished.error();
  return step == Step::Done;
}

Status StoreWriter::setCounter(const CounterState& state) {
  if (auto checked = checkKey(state.key); !checked) return checked;
  if (!setCounter_) {
    if (auto made = makeOptionalTable(database_, kCountersTable); !made) return made;
    auto prepared =
        database_.prepare("INSERT OR REPLACE INTO counters VALUES(?, ?, ?, ?, ?, iif(?, ?, NULL))");
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
  return kept ? Status(Done{}) : Status(database_.error());
}

Status StoreWriter::forgetCountersBefore(std::int32_t day) {
  return database_.execute(("DELETE FROM counters WHERE day < " + std::to_string(day)).c_str());
}

Status StoreWriter::forgetBefore(std::int32_t day) {
  return forgetDaysOfStore(database_, "< ?1", day);
}

Status StoreWriter::forgetDay(std::int32_t day) {
  return forgetDaysOfStore(database_, "= ?1", day);
}

Result<bool> StoreWriter::hasRecent() {
  const auto some = database_.integer("SELECT EXISTS(SELECT 1 FROM recent)");
  if (!some) return some.error();
  if (*some != 0) return true;
  const auto mayArrive = hasTable(database_, kArrivalsTable);
  if (!mayArrive || !*mayArrive) return mayArrive;
  const auto arrivals = database_.integer("SELECT EXISTS(SELECT 1 FROM arrivals)");
  if (!arrivals) return arrivals.error();
  return *arrivals != 0;
}

Result<std::vector<std::int32_t>> StoreWriter::days() {
  return daysOfStore(database_, kMostDaysListed);
}

Result<std::uint64_t> StoreWriter::usedBytes() {
  std::int64_t figures[3];
  const char* const kPragmas[] = {"PRAGMA page_count", "PRAGMA freelist_count", "PRAGMA page_size"};
  for (std::size_t i = 0; i < std::size(kPragmas); ++i) {
    const auto figure = database_.integer(kPragmas[i]);
    if (!figure) return figure.error();
    figures[i] = *figure;
  }
  return static_cast<std::uint64_t>(std::max<std::int64_t>(figures[0] - figures[1], 0)) *
         static_cast<std::uint64_t>(figures[2]);
}

}  // namespace tally
