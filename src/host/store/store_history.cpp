#include "host/store/store_history.h"

#include <algorithm>
#include <array>
#include <limits>
#include <optional>
#include <utility>

#include "base/files/file.h"
#include "host/store/samples/sample_chunk.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

constexpr std::string_view kRange =
    " WHERE day > ?1 AND day <= ?2 AND key >= ?3 AND (?4 IS NULL OR key < ?4)";

// The least text above every one that begins with the prefix; empty when there is none.
std::string endOfPrefix(std::string_view prefix) {
  std::string end(prefix);
  while (!end.empty() && end.back() == '\xff') end.pop_back();
  if (!end.empty()) end.back() = static_cast<char>(static_cast<unsigned char>(end.back()) + 1);
  return end;
}

struct Range {
  Range(std::string_view keyPrefix, std::int32_t minimumDay, std::int32_t maximumDay)
      : prefix(keyPrefix), end(endOfPrefix(keyPrefix)), minimum(minimumDay), maximum(maximumDay) {}
  void bindTo(Statement& statement) const {
    statement.bind(1, std::int64_t{minimum}).bind(2, std::int64_t{maximum}).bind(3, prefix);
    if (!end.empty()) statement.bind(4, std::string_view(end));
  }
  std::string_view prefix;
  std::string end;
  std::int32_t minimum, maximum;
};

// Counts what one enumeration leaves out, and reports it as one line.
class Faults {
 public:
  Faults(const Database& database, const StoreFaultHandler& report)
      : database_(database), report_(report) {}
  ~Faults() {
    if (failed_) {
      report_(reason_);
    } else if (damaged_ > 0) {
      report_(database_
                  .error(std::to_string(damaged_) + " damaged rows are left out, the first for " +
                         reason_)
                  .message);
    }
  }
  Faults(const Faults&) = delete;
  Faults& operator=(const Faults&) = delete;

  void addDamaged(std::string_view key, std::int64_t day) {
    if (damaged_++ == 0)
      reason_ = "the key \"" + std::string(key) + "\" on day " + std::to_string(day);
  }
  // Nothing after this could be read.
  void fail(const Error& error) {
    if (!std::exchange(failed_, true)) reason_ = error.message;
  }

 private:
  const Database& database_;
  const StoreFaultHandler& report_;
  std::size_t damaged_ = 0;
  bool failed_ = false;
  std::string reason_;
};

// One of the two tables that hold samples, walked in the order of day, key and number.
class SampleTable {
 public:
  SampleTable(Database& database, Faults& faults, std::string_view table, const Range& range)
      : database_(database), faults_(faults) {
    const std::string from = " FROM " + std::string(table);
    const std::string ofKey = from + " WHERE day = ?1 AND key = ?2";
    const bool prepared =
        prepare(rows_,
                "SELECT day, key, samples, length(sample_values), length(sample_offsets), "
                "number" +
                    from + std::string(kRange) + " ORDER BY day, key, number") &&
        prepare(values_, "SELECT number, samples, " + std::string(kBoundedValues) +
                             ", length(sample_offsets)" + ofKey + " ORDER BY number") &&
        prepare(offsets_, "SELECT sample_offsets" + ofKey + " AND number = ?3");
    if (!prepared) return;
    range.bindTo(rows_);
    advance();
  }

  // Where the next row is.
  bool atEnd() const { return atEnd_; }
  std::int32_t day() const { return day_; }
  const std::string& key() const { return key_; }
  bool isAt(std::int32_t day, std::string_view key) const {
    return !atEnd_ && day_ == day && key_ == key;
  }

  // Goes on to the next row that can be read. It may be of the same key.
  void advance() {
    Step step = Step::Done;
    while ((step = rows_.step()) == Step::Row) {
      const std::int64_t day = rows_.integer(0);
      const std::string_view key = rows_.text(1);
      if (!order_.follows(rows_, day, key, rows_.integer(5))) {
        return fail(damagedTree(database_));
      }
      if (isStoreKey(key) && chunkIsSound(rows_.integer(2), rows_.integer(3), rows_.integer(4))) {
        day_ = static_cast<std::int32_t>(day);
        if (key_ != key) key_ = key;
        return;
      }
      faults_.addDamaged(key, day);
    }
    atEnd_ = true;
    if (step == Step::Failed) faults_.fail(database_.error());
  }
  void fail(const Error& error) {
    atEnd_ = true;
    faults_.fail(error);
  }

  // Begins to read the samples of a key on a day.
  void openSamples(std::int32_t day, std::string_view key) {
    values_.reset();
    values_.bind(1, std::int64_t{day}).bind(2, key);
    offsets_.reset();
    offsets_.bind(1, std::int64_t{day}).bind(2, key);
    offsetsOfChunk_ = false;
    chunk_ = {};
    taken_ = held_ = 0;
    lastChunk_.reset();
  }
  // As DistributionValues::nextValues, for this table alone.
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) {
    if (taken_ == held_ && !nextChunk()) return 0;
    const std::size_t count = std::min(capacity, held_ - taken_);
    unpackValues(chunk_, taken_, {values, count});
    if (offsets != nullptr) {
      std::fill_n(offsets, count, 0);
      if (offsetsOfChunk_ || fetchOffsets()) {
        unpackOffsets(offsets_.blob(0), taken_, {offsets, count});
      }
    }
    taken_ += count;
    return count;
  }
  void closeSamples() {
    values_.reset();
    offsets_.reset();
  }

 private:
  bool prepare(Statement& statement, const std::string& text) {
    auto prepared = database_.prepare(text);
    if (prepared) {
      statement = std::move(*prepared);
    } else {
      faults_.fail(prepared.error());
    }
    return static_cast<bool>(prepared);
  }

  bool nextChunk() {
    Step step = Step::Done;
    while ((step = values_.step()) == Step::Row) {
      const std::int64_t number = values_.integer(0);
      if (lastChunk_ && number <= *lastChunk_) {
        faults_.fail(damagedTree(database_));
        break;
      }
      lastChunk_ = number;
      chunk_ = values_.blob(2);
      // Damaged ones were counted by the walk over the rows.
      if (!chunkIsSound(values_.integer(1), std::ssize(chunk_), values_.integer(3))) continue;
      held_ = static_cast<std::size_t>(values_.integer(1));
      taken_ = 0;
      offsetsOfChunk_ = false;
      return true;
    }
    if (step == Step::Failed) faults_.fail(database_.error());
    held_ = taken_ = 0;
    return false;
  }

  bool fetchOffsets() {
    offsets_.reset();
    const Step step = offsets_.bind(3, values_.integer(0)).step();
    if (step == Step::Failed) faults_.fail(database_.error());
    return offsetsOfChunk_ = step == Step::Row;
  }

  Database& database_;
  Faults& faults_;
  Statement rows_, values_, offsets_;
  RowOrder order_;
  std::optional<std::int64_t> lastChunk_;
  bool atEnd_ = false;
  std::int32_t day_ = 0;
  std::string key_;
  // The chunk in hand: the column of its values, and how many of them were delivered.
  std::span<const std::byte> chunk_;
  std::size_t held_ = 0, taken_ = 0;
  bool offsetsOfChunk_ = false;
};

// The samples of one key on one day: those of the chunks, then the recent ones.
class SqliteDistributionValues final : public DistributionValues {
 public:
  SqliteDistributionValues(std::span<SampleTable> tables, std::int32_t day, std::string_view key)
      : tables_(tables) {
    for (SampleTable& table : tables_) table.openSamples(day, key);
  }
  ~SqliteDistributionValues() override {
    for (SampleTable& table : tables_) table.closeSamples();
  }
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) override {
    for (; current_ < tables_.size() && capacity > 0; ++current_) {
      if (const auto count = tables_[current_].nextValues(values, offsets, capacity)) return count;
    }
    return 0;
  }

 private:
  std::span<SampleTable> tables_;
  std::size_t current_ = 0;
};

class SqliteHistory final : public HistoryStore {
 public:
  SqliteHistory(Database database, StoreFaultHandler onFault)
      : database_(std::move(database)), onFault_(std::move(onFault)) {}

  void enumerateScalars(std::string_view keyPrefix, std::int32_t minimumDay,
                        std::int32_t maximumDay, const ScalarHandler& handler) override {
    const Range range(keyPrefix, minimumDay, maximumDay);
    Faults faults(database_, onFault_);
    auto rows = database_.prepare("SELECT day, key, value FROM scalars" + std::string(kRange) +
                                  " ORDER BY day, key");
    if (!rows) return faults.fail(rows.error());
    range.bindTo(*rows);
    bool stop = false;
    Step step = Step::Done;
    RowOrder order;
    while (!stop && (step = rows->step()) == Step::Row) {
      const std::int64_t day = rows->integer(0);
      const std::string_view key = rows->text(1);
      if (!order.follows(*rows, day, key)) return faults.fail(damagedTree(database_));
      if (!isStoreKey(key) || rows->type(2) != ColumnType::Integer) {
        faults.addDamaged(key, day);
        continue;
      }
      handler(key, static_cast<std::int32_t>(day), rows->integer(2), stop);
    }
    if (step == Step::Failed) faults.fail(database_.error());
  }

  void enumerateDistributions(std::string_view keyPrefix, std::int32_t minimumDay,
                              std::int32_t maximumDay,
                              const DistributionHandler& handler) override {
    const Range range(keyPrefix, minimumDay, maximumDay);
    Faults faults(database_, onFault_);
    std::array tables{SampleTable(database_, faults, "chunks", range),
                      SampleTable(database_, faults, "recent", range)};
    auto& [chunks, recent] = tables;
    bool stop = false;
    while (!stop && !(chunks.atEnd() && recent.atEnd())) {
      const bool chunksFirst =
          recent.atEnd() || (!chunks.atEnd() && std::pair(chunks.day(), chunks.key()) <=
                                                    std::pair(recent.day(), recent.key()));
      const SampleTable& first = chunksFirst ? chunks : recent;
      const std::int32_t day = first.day();
      const std::string key = first.key();
      {
        SqliteDistributionValues values(tables, day, key);
        handler(key, day, values, stop);
      }
      for (SampleTable& table : tables) {
        while (table.isAt(day, key)) table.advance();
      }
    }
  }

 private:
  Database database_;
  StoreFaultHandler onFault_;
};

class EmptyHistory final : public HistoryStore {
 public:
  void enumerateScalars(std::string_view, std::int32_t, std::int32_t,
                        const ScalarHandler&) override {}
  void enumerateDistributions(std::string_view, std::int32_t, std::int32_t,
                              const DistributionHandler&) override {}
};

}  // namespace

std::unique_ptr<HistoryStore> openSqliteHistory(const StoreFile& file, StoreFaultHandler onFault) {
  auto store = openStoreForReading(file);
  if (!store) onFault(store.error().message);
  if (!store || !*store) return std::make_unique<EmptyHistory>();
  return std::make_unique<SqliteHistory>(std::move(**store), std::move(onFault));
}

void listStoreKeys(const StoreFile& file, const std::function<void(const StoreKey&)>& handler,
                   const StoreFaultHandler& onFault) {
  auto store = openStoreForReading(file);
  if (!store) return onFault(store.error().message);
  if (!*store) return;
  Database& database = **store;
  Faults faults(database, onFault);
  const struct {
    StoreKey::Kind kind;
    std::string_view query;
  } kQueries[] = {
      {StoreKey::Kind::Scalar,
       "SELECT key, min(day), max(day), count(*), 0 FROM scalars GROUP BY key ORDER BY key"},
      {StoreKey::Kind::Distribution,
       "SELECT key, min(day), max(day), count(DISTINCT day), sum(samples) FROM "
       "(SELECT day, key, samples FROM chunks UNION ALL SELECT day, key, samples FROM recent) "
       "GROUP BY key ORDER BY key"},
  };
  for (const auto& [kind, query] : kQueries) {
    auto rows = database.prepare(query);
    if (!rows) return faults.fail(rows.error());
    Step step = Step::Done;
    while ((step = rows->step()) == Step::Row) {
      const std::string_view key = rows->text(0);
      if (!isStoreKey(key)) {
        faults.addDamaged(key, rows->integer(1));
        continue;
      }
      handler({kind, key, rows->integer(1), rows->integer(2), rows->integer(3), rows->integer(4)});
    }
    if (step == Step::Failed) return faults.fail(database.error());
  }
}

}  // namespace tally
