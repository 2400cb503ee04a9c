#include "host/store/samples/sample_source.h"

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

// Samples in two columns: `chunks` or `recent`.
class ChunkSource final : public SampleSource {
 public:
  ChunkSource(Database& database, StoreFaults& faults, std::string_view table,
              const StoreRange& range)
      : database_(database), faults_(faults) {
    const std::string from = " FROM " + std::string(table);
    const std::string ofKey = from + " WHERE day = ?1 AND key = ?2";
    const bool prepared =
        prepare(database_, faults_, rows_,
                "SELECT day, key, samples, length(sample_values), length(sample_offsets), "
                "number" +
                    from + std::string(StoreRange::kCondition) + " ORDER BY day, key, number") &&
        prepare(database_, faults_, values_,
                "SELECT number, samples, " + std::string(kBoundedValues) +
                    ", length(sample_offsets)" + ofKey + " ORDER BY number") &&
        prepare(database_, faults_, offsets_, "SELECT sample_offsets" + ofKey + " AND number = ?3");
    if (!prepared) {
      end();
      return;
    }
    range.bindTo(rows_);
    advance();
  }

  void advance() override {
    Step step = Step::Done;
    while ((step = rows_.step()) == Step::Row) {
      const std::int64_t day = rows_.integer(0);
      const std::string_view key = rows_.text(1);
      if (!order_.follows(rows_, day, key, rows_.integer(5))) {
        end();
        return faults_.fail(damagedTree(database_));
      }
      if (isStoreKey(key) && chunkIsSound(rows_.integer(2), rows_.integer(3), rows_.integer(4))) {
        return moveTo(day, key);
      }
      faults_.addDamaged(key, day);
    }
    end();
    if (step == Step::Failed) faults_.fail(database_.error());
  }

  void openSamples(std::int32_t day, std::string_view key) override {
    values_.reset();
    values_.bind(1, std::int64_t{day}).bind(2, key);
    offsets_.reset();
    offsets_.bind(1, std::int64_t{day}).bind(2, key);
    offsetsOfChunk_ = false;
    chunk_ = {};
    taken_ = held_ = 0;
    lastChunk_.reset();
  }
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) override {
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
  void closeSamples() override {
    values_.reset();
    offsets_.reset();
  }

 private:
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
  StoreFaults& faults_;
  Statement rows_, values_, offsets_;
  RowOrder order_;
  std::optional<std::int64_t> lastChunk_;
  // The chunk in hand: the column of its values, and how many of them were delivered.
  std::span<const std::byte> chunk_;
  std::size_t held_ = 0, taken_ = 0;
  bool offsetsOfChunk_ = false;
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
  PackedSource(Database& database, StoreFaults& faults, const StoreRange& range)
      : BlobSource(database, faults) {
    const bool prepared =
        prepare(database, faults, rows_,
                "SELECT day, key, number, " + std::string(kPackedSummary) + " FROM packed" +
                    std::string(StoreRange::kCondition) + " ORDER BY day, key, number") &&
        prepare(database, faults, blobs_,
                "SELECT number, " + std::string(kBoundedBlob) +
                    " FROM packed WHERE day = ?1 AND key = ?2 ORDER BY number");
    if (!prepared) {
      end();
      return;
    }
    range.bindTo(rows_);
    PackedSource::advance();
  }

  void advance() override {
    Step step = Step::Done;
    while ((step = rows_.step()) == Step::Row) {
      const std::int64_t day = rows_.integer(0);
      const std::string_view key = rows_.text(1);
      if (!order_.follows(rows_, day, key, rows_.integer(2))) return fail(damagedTree(database_));
      if (isStoreKey(key) && packedRowIsSound(rows_, 3)) return moveTo(day, key);
      faults_.addDamaged(key, day);
    }
    end();
    if (step == Step::Failed) faults_.fail(database_.error());
  }

  void openSamples(std::int32_t day, std::string_view key) override {
    clear();
    last_.reset();
    blobs_.reset();
    blobs_.bind(1, std::int64_t{day}).bind(2, key);
  }
  void closeSamples() override { blobs_.reset(); }

 private:
  std::optional<std::span<const std::byte>> nextBlob() override {
    const Step step = blobs_.step();
    if (step == Step::Failed) faults_.fail(database_.error());
    if (step != Step::Row) return std::nullopt;
    const std::int64_t number = blobs_.integer(0);
    if (last_ && number <= *last_) {
      faults_.fail(damagedTree(database_));
      return std::nullopt;
    }
    last_ = number;
    return blobs_.blob(1);
  }

  Statement rows_, blobs_;
  RowOrder order_;
  std::optional<std::int64_t> last_;
};

// Rows in the order of arrival, which are put into the order of day and key in memory.
class ArrivalSource final : public BlobSource {
 public:
  ArrivalSource(Database& database, StoreFaults& faults, const StoreRange& range)
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
    readOrder(rows);
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

  void readOrder(Statement& rows) {
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

std::vector<std::unique_ptr<SampleSource>> openSampleSources(Database& database,
                                                             StoreFaults& faults,
                                                             const StoreRange& range) {
  std::vector<std::unique_ptr<SampleSource>> sources;
  sources.push_back(std::make_unique<ChunkSource>(database, faults, "chunks", range));
  sources.push_back(std::make_unique<ChunkSource>(database, faults, "recent", range));
  const auto has = [&](std::string_view table) {
    const auto exists = hasTable(database, table);
    if (!exists) faults.fail(exists.error());
    return exists && *exists;
  };
  if (has(kPackedTable)) {
    sources.push_back(std::make_unique<PackedSource>(database, faults, range));
  }
  if (has(kArrivalsTable)) {
    sources.push_back(std::make_unique<ArrivalSource>(database, faults, range));
  }
  return sources;
}

}  // namespace tally
