#include "host/store/samples/arrival_source.h"

#include <algorithm>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "host/store/samples/blob_source.h"
#include "host/store/samples/row_walk.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

// What the recorder commits on one device in days. A reader keeps their order in memory, 16 bytes
// for each; a checkpoint has no such limit.
constexpr std::size_t kMostArrivals = 4u << 20;

class ArrivalSource final : public BlobSource {
 public:
  ArrivalSource(Database& database, StoreFaults& faults, const StoreRange& range,
                const HistoryStore::KeyFilter& wanted)
      : BlobSource(database, faults) {
    Statement rows;
    const bool prepared =
        prepareOrFail(database, faults, rows,
                      "SELECT number, day, key, " + std::string(kPackedSummary) + " FROM arrivals" +
                          std::string(StoreRange::kCondition) + " ORDER BY number") &&
        prepareOrFail(database, faults, blobs_,
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

std::unique_ptr<SampleSource> openArrivals(Database& database, StoreFaults& faults,
                                           const StoreRange& range,
                                           const HistoryStore::KeyFilter& wanted) {
  return std::make_unique<ArrivalSource>(database, faults, range, wanted);
}

}  // namespace tally
