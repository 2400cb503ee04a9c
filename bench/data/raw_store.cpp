#include "data/raw_store.h"

#include "host/store/samples/packed_samples.h"

namespace tally::bench {

constexpr std::size_t kChunk = 4096;

std::optional<RawStore> RawStore::make(const StoreFile& file) {
  const auto directory = file.directory.make();
  if (!directory) return std::nullopt;
  auto database = Database::open(*directory, file.name, Database::Access::Create);
  if (!database ||
      !database->execute("PRAGMA page_size = 8192; PRAGMA journal_mode = WAL; BEGIN") ||
      !makeRequiredTables(*database, kRawSchema) || !enterSchema(*database, kRawSchema)) {
    return std::nullopt;
  }
  auto scalar = database->prepare("INSERT INTO scalars VALUES (?1, ?2, ?3)");
  auto chunk = database->prepare("INSERT INTO chunks VALUES (?1, ?2, ?3, ?4, ?5, ?6)");
  if (!scalar || !chunk) return std::nullopt;
  return RawStore(std::move(*database), std::move(*scalar), std::move(*chunk));
}

bool RawStore::addScalar(std::int32_t day, std::string_view key, std::int64_t value) {
  return scalar_.bind(1, std::int64_t{day}).bind(2, key).bind(3, value).run();
}

bool RawStore::addSamples(std::int32_t day, std::string_view key, const SampleColumns& samples) {
  for (std::size_t first = 0; first < samples.values.size(); first += kChunk) {
    const SampleColumns part = slice(samples, first, kChunk);
    const bool added = chunk_.bind(1, std::int64_t{day})
                           .bind(2, key)
                           .bind(3, static_cast<std::int64_t>(first / kChunk))
                           .bind(4, std::ssize(part.values))
                           .bind(5, std::as_bytes(part.values))
                           .bind(6, std::as_bytes(part.offsets))
                           .run();
    if (!added) return false;
  }
  return true;
}

bool RawStore::finish() { return static_cast<bool>(database_.execute("COMMIT")); }

}  // namespace tally::bench
