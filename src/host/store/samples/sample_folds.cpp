#include "host/store/samples/sample_folds.h"

#include <algorithm>
#include <limits>
#include <optional>
#include <utility>

#include "host/store/samples/packed_samples.h"
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

Result<bool> foldArrivals(Database& database, SampleTail& tail,
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
        if (auto finished = tail.finish(); !finished) return finished.error();
        if (auto moved = tail.moveTo(arrival.day, arrival.key); !moved) return moved.error();
      }
      before = &arrival;
      (void)unpackSamples(arrival.blob, PackedColumns::All, samples);
      if (auto appended = tail.append(samples.columns()); !appended) return appended.error();
      if (!remove->bind(1, arrival.number).run()) return database.error();
      timeIsUp = steady_clock::now() >= end;
      if (timeIsUp) break;
    }
    if (auto finished = tail.finish(); !finished) return finished.error();
    if (timeIsUp) return false;
  }
}

}  // namespace tally
