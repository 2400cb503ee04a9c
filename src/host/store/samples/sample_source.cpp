#include "host/store/samples/sample_source.h"

#include <algorithm>
#include <array>

#include "host/store/samples/arrival_source.h"
#include "host/store/samples/row_walk.h"
#include "host/store/samples/sample_row.h"
#include "host/store/store_schema.h"
#include "host/store/version1/former_sources.h"

namespace tally {
namespace {

// Rows of `series`, unpacked straight into the caller's buffers.
class SeriesSource final : public SampleSource {
 public:
  SeriesSource(Database& database, StoreFaults& faults, const StoreRange& range, bool filtered)
      : rows_(database, faults) {
    const std::string columns =
        "samples, weight, length(sample_values), length(sample_weights), length(sample_offsets), " +
        std::string(kBoundedRowWeights) + ", " + std::string(kBoundedRowOffsets);
    if (rows_.open(kSeriesTable, columns, kBoundedRowValues, range, filtered)) {
      SeriesSource::advance();
    } else {
      end();
    }
  }

  void advance() override {
    const bool found = rows_.next([this](const Statement& row, int first) {
      const SampleRow::Shape shape{row.integer(first), row.integer(first + 1),
                                   row.integer(first + 2), row.integer(first + 3),
                                   row.integer(first + 4)};
      // The values of a key that is not wanted are not loaded.
      return rows_.blob().empty() ? shape.isPossible() : row_.open(shape, rows_.blob());
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
    weights_.clear();
    if (taken_ == held_) {
      taken_ = held_ = 0;
      if (!open_.takeRow(*this)) return 0;
      held_ = row_.size();
    }
    const std::size_t count = std::min(capacity, held_ - taken_);
    row_.unpackValues(taken_, {values, count});
    if (row_.isWeighted()) {
      weights_.resize(count);
      row_.unpackWeights(rows_.row().blob(RowWalk::kFirstColumn + 5), taken_, weights_);
    }
    if (offsets != nullptr) {
      row_.unpackOffsets(rows_.row().blob(RowWalk::kFirstColumn + 6), taken_, {offsets, count});
    }
    taken_ += count;
    return count;
  }
  std::span<const std::uint32_t> weights() const override { return weights_; }
  void closeSamples() override { open_.close(); }

 private:
  RowWalk rows_;
  OpenKey open_;
  // The row in hand: how many samples it holds, and how many of them were delivered.
  SampleRow row_;
  std::size_t held_ = 0, taken_ = 0;
  std::vector<std::uint32_t> weights_;  // of those that were delivered last
};

// The samples of one key on one day: those of one source after the other.
class SourceValues final : public DistributionValues {
 public:
  SourceValues(const SampleSources& sources, std::int32_t day, std::string_view key)
      : sources_(sources) {
    for (const auto& source : sources_) source->openSamples(day, key);
  }
  ~SourceValues() override {
    for (const auto& source : sources_) source->closeSamples();
  }
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) override {
    for (; current_ < sources_.size() && capacity > 0; ++current_) {
      if (const auto count = sources_[current_]->nextValues(values, offsets, capacity)) {
        return count;
      }
    }
    return 0;
  }
  std::span<const std::uint32_t> weights() const override {
    return current_ < sources_.size() ? sources_[current_]->weights()
                                      : std::span<const std::uint32_t>();
  }

 private:
  const SampleSources& sources_;
  std::size_t current_ = 0;
};

}  // namespace

SampleSources openSampleSources(Database& database, StoreFaults& faults, const StoreRange& range,
                                const HistoryStore::KeyFilter& wanted) {
  SampleSources sources;
  const bool filtered = static_cast<bool>(wanted);
  if (filtered) {
    if (const Status added = database.addPredicate(kWantedFunction, wanted); !added) {
      faults.fail(added.error());
      return sources;
    }
  }
  openFormerSources(database, faults, range, filtered, sources);
  constexpr std::string_view kPresent[] = {kSeriesTable, kArrivalsTable};
  const auto tables = presentTables(database, kPresent);
  if (!tables) faults.fail(tables.error());
  for (const std::string_view table : tables ? *tables : std::vector<std::string_view>()) {
    if (table == kSeriesTable) {
      sources.push_back(std::make_unique<SeriesSource>(database, faults, range, filtered));
    } else {
      sources.push_back(openArrivals(database, faults, range, wanted));
    }
  }
  return sources;
}

void enumerateSources(const SampleSources& sources,
                      const HistoryStore::DistributionHandler& handler) {
  for (bool stop = false; !stop;) {
    const SampleSource* first = nullptr;
    for (const auto& source : sources) {
      if (source->atEnd()) continue;
      if (first == nullptr || source->place() < first->place()) {
        first = source.get();
      }
    }
    if (first == nullptr) return;
    const std::int32_t day = first->place().first;
    const std::string key(first->place().second);
    {
      SourceValues values(sources, day, key);
      handler(key, day, values, stop);
    }
    for (const auto& source : sources) {
      while (!source->atEnd() && source->place() == SamplePlace(day, key)) source->advance();
    }
  }
}

}  // namespace tally
