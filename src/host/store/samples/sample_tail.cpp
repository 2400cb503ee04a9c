#include "host/store/samples/sample_tail.h"

#include <algorithm>

#include "host/store/samples/sample_chunk.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {

static_assert(kChunkSamples == kMostPackedSamples);

Result<SampleTail> SampleTail::open(Database& database, Table table) {
  SampleTail tail(database, table);
  const bool isChunks = table == Table::Chunks;
  if (!isChunks) {
    if (auto made = makeOptionalTable(database, kPackedTable); !made) return made.error();
  }
  const std::string name(isChunks ? "chunks" : kPackedTable);
  const std::string columns =
      isChunks ? std::string(kBoundedValues) + ", " + std::string(kBoundedOffsets)
               : std::string(kBoundedBlob);
  auto last = database.prepare("SELECT number, samples, " + columns + " FROM " + name +
                               " WHERE day = ?1 AND key = ?2 ORDER BY number DESC LIMIT 1");
  if (!last) return last.error();
  auto put =
      database.prepare("INSERT OR REPLACE INTO " + name + " VALUES (?1, ?2, ?3, ?4, ?5, ?6)");
  if (!put) return put.error();
  tail.last_ = std::move(*last);
  tail.put_ = std::move(*put);
  return tail;
}

bool SampleTail::take(const Statement& row) {
  const std::int64_t samples = row.integer(1);
  if (samples >= static_cast<std::int64_t>(kMostPackedSamples)) return false;
  if (table_ == Table::Packed) return unpackSamples(row.blob(2), PackedColumns::All, held_);
  const auto values = row.blob(2), offsets = row.blob(3);
  if (!chunkIsSound(samples, std::ssize(values), std::ssize(offsets))) return false;
  held_.values.resize(static_cast<std::size_t>(samples));
  held_.offsets.resize(held_.values.size());
  unpackValues(values, 0, held_.values);
  unpackOffsets(offsets, 0, held_.offsets);
  return true;
}

Status SampleTail::moveTo(std::int32_t day, std::string_view key) {
  day_ = day;
  key_ = key;
  held_.clear();
  last_.reset();
  const Step step = last_.bind(1, std::int64_t{day}).bind(2, key).step();
  if (step == Step::Failed) return database_->error();
  number_ = 0;
  if (step == Step::Row) {
    const std::int64_t number = last_.integer(0);
    number_ = take(last_) ? number : number + (number < kMostRowsOfKey ? 1 : 0);
  }
  last_.reset();
  if (number_ >= 0 && number_ < kMostRowsOfKey) return Done{};
  return database_->error("the chunks of " + key_ + " are numbered out of range");
}

Status SampleTail::append(const SampleColumns& samples) {
  for (std::size_t first = 0; first < samples.values.size();) {
    const auto part = slice(samples, first, kMostPackedSamples - held_.size());
    held_.append(part);
    first += part.values.size();
    if (held_.size() < kMostPackedSamples) break;
    if (auto written = write(); !written) return written;
    held_.clear();
    ++number_;
  }
  return Done{};
}

Status SampleTail::finish() {
  if (held_.values.empty()) return Done{};
  auto written = write();
  held_.clear();
  return written;
}

Status SampleTail::write() {
  std::vector<std::byte> blob;
  put_.bind(1, std::int64_t{day_}).bind(2, key_).bind(3, number_).bind(4, std::ssize(held_.values));
  if (table_ == Table::Chunks) {
    put_.bind(5, packValues(held_.values)).bind(6, packOffsets(held_.offsets));
  } else {
    blob = packSamples(held_.columns());
    put_.bind(5, static_cast<std::int64_t>(weightOf(held_.columns()))).bind(6, std::span(blob));
  }
  return put_.run() ? Status(Done{}) : database_->error();
}

}  // namespace tally
