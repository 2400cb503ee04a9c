#include "host/store/samples/sample_source.h"

#include <fmt/format.h>

#include <algorithm>
#include <optional>
#include <unordered_map>

#include "host/store/samples/packed_samples.h"
#include "host/store/samples/sample_chunk.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

// What the recorder commits on one device in days. A reader keeps their order in memory, 16 bytes
// for each; a checkpoint has no such limit.
constexpr std::size_t kMostArrivals = 4u << 20;

// Of SQL: whether samples of a key are wanted.
constexpr const char* kWantedFunction = "tally_wanted";

bool prepare(Database& database, StoreFaults& faults, Statement& statement,
             const std::string& text) {
  auto prepared = database.prepare(text);
  if (prepared) {
    statement = std::move(*prepared);
  } else {
    faults.fail(prepared.error());
  }
  return static_cast<bool>(prepared);
}

// A walk along a table whose primary key is (day, key, number). Finding a row anew costs the
// database several of its neighbours with all their blobs, so that a row is read, blob and all,
// when the walk comes to it; of keys that are not wanted the blob stays on the disk.
class RowWalk {
 public:
  RowWalk(Database& database, StoreFaults& faults) : database_(database), faults_(faults) {}

  // The columns that tell whether a row is sound, and its blob. False if the table cannot be read.
  bool open(std::string_view table, std::string_view columns, std::string_view blob,
            const StoreRange& range, bool filtered) {
    const std::string wanted =
        filtered ? fmt::format("iif({}(key), {}, NULL)", kWantedFunction, blob) : std::string(blob);
    if (!prepare(database_, faults_, rows_,
                 fmt::format("SELECT day, key, number, {}, {} FROM {}{} ORDER BY day, key, number",
                             wanted, columns, table, StoreRange::kCondition))) {
      return false;
    }
    range.bindTo(rows_);
    return true;
  }

  // Goes on to the next row that is sound and wanted; false at the end. isSound is given the row
  // and its first column of those of open().
  template <class IsSound>
  bool next(const IsSound& isSound) {
    Step step = Step::Done;
    while ((step = rows_.step()) == Step::Row) {
      if (!order_.follows(rows_, day(), key(), number())) {
        faults_.fail(damagedTree(database_));
        return false;
      }
      if (!isStoreKey(key()) || !isSound(rows_, kFirstColumn)) {
        faults_.addDamaged(key(), day());
      } else if (!blob().empty()) {
        return true;
      }
    }
    if (step == Step::Failed) faults_.fail(database_.error());
    return false;
  }

  std::int64_t day() const { return rows_.integer(0); }
  std::string_view key() const { return rows_.text(1); }
  std::int64_t number() const { return rows_.integer(2); }
  std::span<const std::byte> blob() const { return rows_.blob(3); }
  const Statement& row() const { return rows_; }
  static constexpr int kFirstColumn = 4;

 private:
  Database& database_;
  StoreFaults& faults_;
  Statement rows_;
  RowOrder order_;
};

// Which rows of a walk belong to the key whose samples are read.
class OpenKey {
 public:
  void open(bool isHere) {
    isOpen_ = isHere;
    isTaken_ = false;
  }
  void close() { isOpen_ = false; }
  // The row where the source is, then each that follows; false when the next is of another key.
  bool takeRow(SampleSource& source) {
    if (!isOpen_) return false;
    if (!std::exchange(isTaken_, true)) return true;
    const std::int32_t day = source.place().first;
    key_ = source.place().second;
    source.advance();
    return isOpen_ = !source.atEnd() && source.place() == SamplePlace(day, key_);
  }

 private:
  bool isOpen_ = false, isTaken_ = false;
  std::string key_;
};

// Samples in two columns: `chunks` or `recent`.
class ChunkSource final : public SampleSource {
 public:
  ChunkSource(Database& database, StoreFaults& faults, std::string_view table,
              const StoreRange& range, bool filtered)
      : database_(database), faults_(faults), rows_(database, faults) {
    const bool prepared =
        rows_.open(table, "samples, length(sample_values), length(sample_offsets)", kBoundedValues,
                   range, filtered) &&
        prepare(database_, faults_, offsets_,
                fmt::format("SELECT sample_offsets FROM {} WHERE day = ?1 AND key = ?2 AND number "
                            "= ?3",
                            table));
    if (prepared) {
      ChunkSource::advance();
    } else {
      end();
    }
  }

  void advance() override {
    const bool found = rows_.next([](const Statement& row, int first) {
      return chunkIsSound(row.integer(first), row.integer(first + 1), row.integer(first + 2));
    });
    if (found) {
      moveTo(rows_.day(), rows_.key());
    } else {
      end();
    }
  }

  void openSamples(std::int32_t day, std::string_view key) override {
    open_.open(!atEnd() && place() == SamplePlace(day, key));
    taken_ = held_ = 0;
  }
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) override {
    if (taken_ == held_) {
      taken_ = held_ = 0;
      if (!open_.takeRow(*this)) return 0;
      held_ = static_cast<std::size_t>(rows_.row().integer(RowWalk::kFirstColumn));
      hasOffsets_ = false;
    }
    const std::size_t count = std::min(capacity, held_ - taken_);
    unpackValues(rows_.blob(), taken_, {values, count});
    if (offsets != nullptr) {
      std::fill_n(offsets, count, 0);
      if (hasOffsets_ || fetchOffsets()) {
        unpackOffsets(offsets_.blob(0), taken_, {offsets, count});
      }
    }
    taken_ += count;
    return count;
  }
  void closeSamples() override {
    open_.close();
    offsets_.reset();
  }

 private:
  bool fetchOffsets() {
    offsets_.reset();
    const Step step =
        offsets_.bind(1, rows_.day()).bind(2, rows_.key()).bind(3, rows_.number()).step();
    if (step == Step::Failed) faults_.fail(database_.error());
    return hasOffsets_ = step == Step::Row;
  }

  Database& database_;
  StoreFaults& faults_;
  RowWalk rows_;
  OpenKey open_;
  Statement offsets_;
  // Of the chunk in hand: how many samples it holds, and how many of them were delivered.
  std::size_t held_ = 0, taken_ = 0;
  bool hasOffsets_ = false;
};

// Samples in packed blobs. Which row is next is known to the classes below.
class BlobSource : public SampleSource {
 public:
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) final {
    first_ += count_;
    count_ = 0;
    if (first_ == held_.size() && !nextRow(offsets != nullptr)) return 0;
    if (offsets != nullptr && held_.offsets.empty()) {
      (void)unpackSamples(blob_, PackedColumns::All, held_);
    }
    const SampleColumns part = slice(held_.columns(), first_, capacity);
    count_ = part.values.size();
    std::ranges::copy(part.values, values);
    if (offsets != nullptr) std::ranges::copy(part.offsets, offsets);
    return count_;
  }
  std::span<const std::uint32_t> weights() const final {
    return slice(held_.columns(), first_, count_).weights;
  }

 protected:
  BlobSource(Database& database, StoreFaults& faults) : database_(database), faults_(faults) {}

  // The blob of the next row, valid until the next call; empty at the end.
  virtual std::optional<std::span<const std::byte>> nextBlob() = 0;

  void clear() {
    held_.clear();
    first_ = count_ = 0;
  }
  void fail(const Error& error) {
    end();
    faults_.fail(error);
  }

  Database& database_;
  StoreFaults& faults_;

 private:
  bool nextRow(bool withOffsets) {
    clear();
    while (const auto blob = nextBlob()) {
      blob_ = *blob;
      const auto columns = withOffsets ? PackedColumns::All : PackedColumns::ValuesAndWeights;
      // Damaged ones were counted by the walk over the rows.
      if (unpackSamples(blob_, columns, held_)) return true;
    }
    return false;
  }

  // The row in hand, and what of it was delivered last.
  std::span<const std::byte> blob_;
  SampleVectors held_;
  std::size_t first_ = 0, count_ = 0;
};

class PackedSource final : public BlobSource {
 public:
  PackedSource(Database& database, StoreFaults& faults, const StoreRange& range, bool filtered)
      : BlobSource(database, faults), rows_(database, faults) {
    if (rows_.open(kPackedTable, kPackedSummary, kBoundedBlob, range, filtered)) {
      PackedSource::advance();
    } else {
      end();
    }
  }

  void advance() override {
    if (rows_.next(packedRowIsSound)) {
      moveTo(rows_.day(), rows_.key());
    } else {
      end();
    }
  }

  void openSamples(std::int32_t day, std::string_view key) override {
    clear();
    open_.open(!atEnd() && place() == SamplePlace(day, key));
  }
  void closeSamples() override { open_.close(); }

 private:
  std::optional<std::span<const std::byte>> nextBlob() override {
    if (!open_.takeRow(*this)) return std::nullopt;
    return rows_.blob();
  }

  RowWalk rows_;
  OpenKey open_;
};

// Rows in the order of arrival, which are put into the order of day and key in memory.
class ArrivalSource final : public BlobSource {
 public:
  ArrivalSource(Database& database, StoreFaults& faults, const StoreRange& range,
                const HistoryStore::KeyFilter& wanted)
      : BlobSource(database, faults) {
    Statement rows;
    const bool prepared =
        prepare(database, faults, rows,
                "SELECT number, day, key, " + std::string(kPackedSummary) + " FROM arrivals" +
                    std::string(StoreRange::kCondition) + " ORDER BY number") &&
        prepare(database, faults, blobs_,
                "SELECT " + std::string(kBoundedBlob) + " FROM arrivals WHERE number = ?1");
    if (!prepared) {
      end();
      return;
    }
    range.bindTo(rows);
    readOrder(rows, wanted);
    if (!atEnd()) ArrivalSource::advance();
  }

  void advance() override {
    if (next_ == places_.size()) return end();
    moveTo(places_[next_].day, places_[next_].key);
    ++next_;
  }

  void openSamples(std::int32_t day, std::string_view key) override {
    clear();
    const auto place = std::ranges::lower_bound(places_, SamplePlace(day, key), {},
                                                [](const Place& other) { return other.place(); });
    const bool found = place != places_.end() && place->place() == SamplePlace(day, key);
    numbers_ = found ? std::span(place->numbers) : std::span<const std::int64_t>();
  }
  void closeSamples() override { blobs_.reset(); }

 private:
  struct Place {
    std::int32_t day;
    std::string key;
    std::vector<std::int64_t> numbers;
    SamplePlace place() const { return {day, key}; }
  };

  void readOrder(Statement& rows, const HistoryStore::KeyFilter& wanted) {
    std::unordered_map<std::string, std::size_t> found;  // places by day and key
    std::string name;
    std::optional<std::int64_t> last;
    std::size_t count = 0;
    Step step = Step::Done;
    while ((step = rows.step()) == Step::Row) {
      const std::int64_t number = rows.integer(0), day = rows.integer(1);
      const std::string_view key = rows.text(2);
      if (last && number <= *last) return fail(damagedTree(database_));
      last = number;
      if (!isStoreKey(key) || !packedRowIsSound(rows, 3)) {
        faults_.addDamaged(key, day);
        continue;
      }
      if (wanted && !wanted(key)) continue;
      if (++count > kMostArrivals) {
        return fail(database_.error("more new rows than can be put in order; checkpoint first"));
      }
      name.assign(reinterpret_cast<const char*>(&day), sizeof day).append(key);
      const auto [entry, added] = found.try_emplace(name, places_.size());
      if (added) places_.push_back({static_cast<std::int32_t>(day), std::string(key), {}});
      places_[entry->second].numbers.push_back(number);
    }
    if (step == Step::Failed) return fail(database_.error());
    std::ranges::sort(places_, {}, &Place::place);
  }

  std::optional<std::span<const std::byte>> nextBlob() override {
    if (numbers_.empty()) return std::nullopt;
    blobs_.reset();
    const Step step = blobs_.bind(1, numbers_.front()).step();
    numbers_ = numbers_.subspan(1);
    if (step == Step::Failed) faults_.fail(database_.error());
    if (step != Step::Row) return std::nullopt;
    return blobs_.blob(0);
  }

  Statement blobs_;
  std::vector<Place> places_;
  std::size_t next_ = 0;
  std::span<const std::int64_t> numbers_;  // of the rows of the open key that are still to come
};

}  // namespace

std::vector<std::unique_ptr<SampleSource>> openSampleSources(
    Database& database, StoreFaults& faults, const StoreRange& range,
    const HistoryStore::KeyFilter& wanted) {
  std::vector<std::unique_ptr<SampleSource>> sources;
  const bool filtered = static_cast<bool>(wanted);
  if (filtered) {
    if (const Status added = database.addPredicate(kWantedFunction, wanted); !added) {
      faults.fail(added.error());
      return sources;
    }
  }
  for (const char* const table : {"chunks", "recent"}) {
    sources.push_back(std::make_unique<ChunkSource>(database, faults, table, range, filtered));
  }
  const auto has = [&](std::string_view table) {
    const auto exists = hasTable(database, table);
    if (!exists) faults.fail(exists.error());
    return exists && *exists;
  };
  if (has(kPackedTable)) {
    sources.push_back(std::make_unique<PackedSource>(database, faults, range, filtered));
  }
  if (has(kArrivalsTable)) {
    sources.push_back(std::make_unique<ArrivalSource>(database, faults, range, wanted));
  }
  return sources;
}

}  // namespace tally
