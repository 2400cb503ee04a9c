#include "host/store/store_conversion.h"

#include <limits>
#include <vector>

#include "host/store/samples/sample_tail.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"
#include "host/store/version1/former_sources.h"

namespace tally {
namespace {

// Samples in hand while they are moved.
constexpr std::size_t kPiece = 4096;

// The samples of one key on one day.
Status move(SampleTail& tail, DistributionValues& samples) {
  std::vector<double> values(kPiece);
  std::vector<std::uint32_t> offsets(kPiece);
  while (const auto count = samples.nextValues(values.data(), offsets.data(), kPiece)) {
    const SampleColumns piece{std::span(values).first(count), std::span(offsets).first(count),
                              samples.weights()};
    if (auto appended = tail.append(piece); !appended) return appended;
  }
  return tail.finish();
}

Status moveSamples(Database& database, const StoreFaultHandler& onFault) {
  auto tail = SampleTail::open(database);
  if (!tail) return tail.error();
  using Days = std::numeric_limits<std::int32_t>;
  const StoreRange allDays("", std::int64_t{Days::min()} - 1, Days::max());
  StoreLosses losses;
  Status moved = Done{};
  std::string reason;
  const std::function<void(const std::string&)> report = [&](const std::string& message) {
    reason = message;
  };
  {
    StoreFaults faults(database, report, &losses);
    SampleSources sources;
    openFormerSources(database, faults, allDays, false, sources);
    enumerateSources(sources, [&](std::string_view key, std::int32_t day,
                                  DistributionValues& samples, bool& stop) {
      moved = tail->moveTo(day, key);
      if (moved) moved = move(*tail, samples);
      stop = !moved;
    });
  }
  // First: a full disk ends the reading too, and what follows fails for another reason.
  if (!losses.isComplete) return Error{reason};
  if (moved && losses.damagedRows > 0) onFault(reason);
  return moved;
}

Status convert(Database& database, const StoreFaultHandler& onFault) {
  // Another process may have been first.
  const auto version = schemaVersion(database);
  if (!version) return version.error();
  if (*version >= kPackedSchema) return Done{};
  if (auto made = makeRequiredTables(database, kPackedSchema); !made) return made;
  if (auto moved = moveSamples(database, onFault); !moved) return moved;
  return enterSchema(database, kPackedSchema);
}

}  // namespace

Status convertToPackedSchema(Database& database, const StoreFaultHandler& onFault) {
  if (auto begun = database.execute("BEGIN IMMEDIATE"); !begun) return begun;
  Status done = convert(database, onFault);
  if (done) done = database.execute("COMMIT");
  if (!done) (void)database.execute("ROLLBACK");
  return done;
}

}  // namespace tally
