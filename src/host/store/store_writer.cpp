#include "host/store/store_writer.h"

#include <algorithm>
#include <limits>
#include <vector>

#include "host/store/samples/sample_folds.h"
#include "host/store/store_conversion.h"
#include "host/store/store_days.h"
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
  return std::optional(StoreWriter(std::make_unique<Database>(std::move(**opened))));
}

Status StoreWriter::begin() {
  // The transaction before may have been undone, with the tables that it made, and another process
  // may have given the store other tables since.
  arrivals_.reset();
  tail_.reset();
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
  if (!setScalar_) {
    auto prepared = database_->prepare("INSERT OR REPLACE INTO scalars VALUES (?1, ?2, ?3)");
    if (!prepared) return prepared.error();
    setScalar_ = std::move(*prepared);
  }
  const bool set = setScalar_->bind(1, std::int64_t{day}).bind(2, key).bind(3, value).run();
  return set ? Status(Done{}) : database_->error();
}

Status StoreWriter::pushSamples(std::int32_t day, std::string_view key,
                                std::span<const double> values,
                                std::span<const std::uint32_t> offsets) {
  if (auto valid = checkKey(key); !valid) return valid;
  if (!arrivals_) {
    auto opened = ArrivalTable::open(*database_);
    if (!opened) return opened.error();
    arrivals_ = std::move(*opened);
  }
  return arrivals_->add(day, key, {values, offsets, {}});
}

Result<SampleTail*> StoreWriter::tail() {
  if (!tail_) {
    auto opened = SampleTail::open(*database_);
    if (!opened) return opened.error();
    tail_ = std::move(*opened);
  }
  return &*tail_;
}

Status StoreWriter::appendSamples(std::int32_t day, std::string_view key,
                                  const SampleColumns& samples) {
  if (auto valid = checkKey(key); !valid) return valid;
  const auto opened = tail();
  if (!opened) return opened.error();
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
  const auto mayArrive = hasTable(*database_, kArrivalsTable);
  if (!mayArrive) return mayArrive.error();
  if (!*mayArrive) return true;
  const auto opened = tail();
  if (!opened) return opened.error();
  return foldArrivals(*database_, **opened, end);
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

Result<bool> StoreWriter::isPacked() {
  const auto version = schemaVersion(*database_);
  if (!version) return version.error();
  return *version == kPackedSchema;
}

Status StoreWriter::convertToPackedSchema(const std::function<void(const std::string&)>& onFault) {
  arrivals_.reset();
  tail_.reset();
  return tally::convertToPackedSchema(*database_, onFault);
}

}  // namespace tally
