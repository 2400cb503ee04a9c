#include "host/store/samples/arrival_table.h"

#include "host/store/samples/packed_samples.h"
#include "host/store/store_schema.h"

namespace tally {

Result<ArrivalTable> ArrivalTable::open(Database& database) {
  if (auto made = makeOptionalTable(database, kArrivalsTable); !made) return made.error();
  auto add = database.prepare("INSERT INTO arrivals VALUES (NULL, ?1, ?2, ?3, ?4, ?5)");
  if (!add) return add.error();
  ArrivalTable table(database);
  table.add_ = std::move(*add);
  return table;
}

Status ArrivalTable::add(std::int32_t day, std::string_view key, const SampleColumns& samples) {
  for (std::size_t first = 0; first < samples.values.size(); first += kMostPackedSamples) {
    const SampleColumns part = slice(samples, first, kMostPackedSamples);
    const auto blob = packSamples(part);
    const bool added = add_.bind(1, std::int64_t{day})
                           .bind(2, key)
                           .bind(3, std::ssize(part.values))
                           .bind(4, static_cast<std::int64_t>(weightOf(part)))
                           .bind(5, std::span(blob))
                           .run();
    if (!added) return database_->error();
  }
  return Done{};
}

}  // namespace tally
