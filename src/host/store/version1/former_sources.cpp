#include "host/store/version1/former_sources.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>

#include "base/byte_reader.h"
#include "host/store/samples/blob_source.h"
#include "host/store/samples/row_walk.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

// A chunk has the values of successive samples in one column, 64-bit floating point, and their
// seconds into the day in another, unsigned 32-bit; both little endian and without gaps.
constexpr std::int64_t kMostSamples = 1 << 20;

// The values, without loading a column that is longer than any chunk may have.
constexpr std::string_view kBoundedValues =
    "iif(length(sample_values) <= 8388608, sample_values, NULL)";

// Whether the columns of a chunk have the lengths that its count of samples says, and a count that
// memory can hold whoever wrote it. The row's columns: the count and both lengths.
bool chunkIsSound(const Statement& row, int first) {
  const std::int64_t samples = row.integer(first);
  return samples > 0 && samples <= kMostSamples &&
         row.integer(first + 1) == samples * std::int64_t{sizeof(double)} &&
         row.integer(first + 2) == samples * std::int64_t{sizeof(std::uint32_t)};
}

template <class T>
void unpack(std::span<const std::byte> column, std::size_t first, std::span<T> out) {
  const auto bytes = ByteReader(column).slice(first * sizeof(T), out.size_bytes());
  if (bytes && !bytes->empty()) std::memcpy(out.data(), bytes->data(), bytes->size());
}

// Samples in two columns: `chunks` or `recent`.
class ChunkSource final : public SampleSource {
 public:
  ChunkSource(Database& database, StoreFaults& faults, std::string_view table,
              const StoreRange& range, bool filtered)
      : database_(database), faults_(faults), rows_(database, faults) {
    const bool prepared =
        rows_.open(table, "samples, length(sample_values), length(sample_offsets)", kBoundedValues,
                   range, filtered) &&
        prepareOrFail(
            database_, faults_, offsets_,
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
    if (rows_.next(chunkIsSound)) {
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
    unpack(rows_.blob(), taken_, std::span(values, count));
    if (offsets != nullptr) {
      std::fill_n(offsets, count, 0);
      if (hasOffsets_ || fetchOffsets()) {
        unpack(offsets_.blob(0), taken_, std::span(offsets, count));
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

// Packed rows in the order of day and key.
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

}  // namespace

void openFormerSources(Database& database, StoreFaults& faults, const StoreRange& range,
                       bool filtered, std::vector<std::unique_ptr<SampleSource>>& sources) {
  constexpr std::string_view kFormer[] = {kChunksTable, kRecentTable, kPackedTable};
  const auto tables = presentTables(database, kFormer);
  if (!tables) return faults.fail(tables.error());
  for (const std::string_view table : *tables) {
    if (table == kPackedTable) {
      sources.push_back(std::make_unique<PackedSource>(database, faults, range, filtered));
    } else {
      sources.push_back(std::make_unique<ChunkSource>(database, faults, table, range, filtered));
    }
  }
}

}  // namespace tally
