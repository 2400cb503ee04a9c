#include "host/store/samples/sample_folds.h"

#include <algorithm>
#include <limits>
#include <optional>
#include <utility>

#include "host/store/samples/sample_chunk.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

using std::chrono::steady_clock;

// Rows that are put in order together. A key's last row is written anew for each such batch, so it
// is to hold what the recorder commits in a day.
constexpr std::size_t kBytesOfBatch = 4u << 20;
constexpr std::size_t kBytesOfArrival = 96;  // beside its blob and its key

struct Arrival {
  std::int64_t number;
  std::int32_t day;
  std::string key;
  std::vector<std::byte> blob;
  auto place() const { return std::pair<std::int32_t, std::string_view>(day, key); }
};

// The next rows in the order of their arrival, after the row of that number, which moves on.
Result<std::vector<Arrival>> nextArrivals(Database& database, std::int64_t& after) {
  auto rows = database.prepare("SELECT number, day, key, " + std::string(kPackedSummary) + ", " +
                               std::string(kBoundedBlob) +
                               " FROM arrivals WHERE number > ?1 AND day BETWEEN -2147483648 AND "
                               "2147483647 ORDER BY number");
  if (!rows) return rows.error();
  rows->bind(1, after);
  std::vector<Arrival> batch;
  std::size_t bytes = 0;
  Step step = Step::Done;
  while (bytes < kBytesOfBatch && (step = rows->step()) == Step::Row) {
    const std::int64_t number = rows->integer(0);
    if (number <= after) return damagedTree(database);
    after = number;
    const std::string_view key = rows->text(2);
    if (!isStoreKey(key) || !packedRowIsSound(*rows, 3)) continue;
    const auto blob = rows->blob(7);
    batch.push_back({number, static_cast<std::int32_t>(rows->integer(1)), std::string(key),
                     std::vector(blob.begin(), blob.end())});
    bytes += kBytesOfArrival + key.size() + blob.size();
  }
  if (step == Step::Failed) return database.error();
  return batch;
}

}  // namespace

Result<bool> foldRecent(Database& database, SampleTail& chunks,
                        std::chrono::steady_clock::time_point end) {
  auto rows = database.prepare(
      "SELECT day, key, number, samples, " + std::string(kBoundedValues) + ", " +
      std::string(kBoundedOffsets) +
      " FROM recent WHERE day BETWEEN -2147483648 AND 2147483647 ORDER BY day, key, number");
  if (!rows) return rows.error();
  auto remove = database.prepare("DELETE FROM recent WHERE day = ?1 AND key = ?2 AND number = ?3");
  if (!remove) return remove.error();
  bool started = false;
  std::int64_t day = 0;
  std::string key;
  SampleVectors samples;
  Step step = Step::Done;
  RowOrder order;
  while ((step = rows->step()) == Step::Row) {
    const std::int64_t number = rows->integer(2), count = rows->integer(3);
    const auto valueColumn = rows->blob(4), offsetColumn = rows->blob(5);
    const std::int64_t rowDay = rows->integer(0);
    const std::string_view rowKey = rows->text(1);
    if (!order.follows(*rows, rowDay, rowKey, number)) return damagedTree(database);
    if (!isStoreKey(rowKey) ||
        !chunkIsSound(count, std::ssize(valueColumn), std::ssize(offsetColumn))) {
      continue;
    }
    if (!started || day != rowDay || key != rowKey) {
      if (auto finished = chunks.finish(); !finished) return finished.error();
      day = rowDay;
      key = rowKey;
      if (auto moved = chunks.moveTo(static_cast<std::int32_t>(day), key); !moved) {
        return moved.error();
      }
      started = true;
    }
    samples.values.resize(static_cast<std::size_t>(count));
    samples.offsets.resize(samples.values.size());
    unpackValues(valueColumn, 0, samples.values);
    unpackOffsets(offsetColumn, 0, samples.offsets);
    if (auto appended = chunks.append(samples.columns()); !appended) return appended.error();
    if (!remove->bind(1, day).bind(2, key).bind(3, number).run()) return database.error();
    if (std::chrono::steady_clock::now() >= end) break;
  }
  if (step == Step::Failed) return database.error();
  if (auto finished = chunks.finish(); !finished) return finished.error();
  return step == Step::Done;
}

Result<bool> foldArrivals(Database& database, SampleTail& packed,
                          std::chrono::steady_clock::time_point end) {
  auto remove = database.prepare("DELETE FROM arrivals WHERE number = ?1");
  if (!remove) return remove.error();
  SampleVectors samples;
  for (std::int64_t after = std::numeric_limits<std::int64_t>::min();;) {
    auto batch = nextArrivals(database, after);
    if (!batch) return batch.error();
    if (batch->empty()) return true;
    std::ranges::stable_sort(*batch, {}, &Arrival::place);
    const Arrival* before = nullptr;
    bool timeIsUp = false;
    for (const Arrival& arrival : *batch) {
      if (before == nullptr || before->place() != arrival.place()) {
        if (auto finished = packed.finish(); !finished) return finished.error();
        if (auto moved = packed.moveTo(arrival.day, arrival.key); !moved) return moved.error();
      }
      before = &arrival;
      (void)unpackSamples(arrival.blob, PackedColumns::All, samples);
      if (auto appended = packed.append(samples.columns()); !appended) return appended.error();
      if (!remove->bind(1, arrival.number).run()) return database.error();
      timeIsUp = steady_clock::now() >= end;
      if (timeIsUp) break;
    }
    if (auto finished = packed.finish(); !finished) return finished.error();
    if (timeIsUp) return false;
  }
}

}  // namespace tally
