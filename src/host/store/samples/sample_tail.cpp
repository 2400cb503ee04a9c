#include "host/store/samples/sample_tail.h"

#include <algorithm>

#include "host/store/samples/sample_row.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {

SampleTail::SampleTail(Database& database, bool isSeries)
    : database_(&database),
      isSeries_(isSeries),
      capacity_(isSeries ? kMostRowSamples : kMostPackedSamples) {}

Result<SampleTail> SampleTail::open(Database& database) {
  const auto isSeries = hasTable(database, kSeriesTable);
  if (!isSeries) return isSeries.error();
  if (!*isSeries) {
    if (auto made = makeOptionalTable(database, kPackedTable); !made) return made.error();
  }
  SampleTail tail(database, *isSeries);
  const std::string name(*isSeries ? kSeriesTable : kPackedTable);
  std::string columns(kBoundedBlob);
  if (*isSeries) {
    columns = "length(sample_values), length(sample_weights), length(sample_offsets)";
    for (const std::string_view column :
         {kBoundedRowValues, kBoundedRowWeights, kBoundedRowOffsets}) {
      columns += ", " + std::string(column);
    }
  }
  auto last = database.prepare("SELECT number, samples, weight, " + columns + " FROM " + name +
                               " WHERE day = ?1 AND key = ?2 ORDER BY number DESC LIMIT 1");
  if (!last) return last.error();
  auto put = database.prepare("INSERT OR REPLACE INTO " + name + " VALUES (?1, ?2, ?3, ?4, ?5, ?6" +
                              (*isSeries ? ", ?7, ?8)" : ")"));
  if (!put) return put.error();
  tail.last_ = std::move(*last);
  tail.put_ = std::move(*put);
  return tail;
}

bool SampleTail::take(const Statement& row) {
  const std::int64_t samples = row.integer(1);
  if (samples >= static_cast<std::int64_t>(capacity_)) return false;
  if (!isSeries_) return unpackSamples(row.blob(3), PackedColumns::All, held_);
  SampleRow packed;
  const SampleRow::Shape shape{samples, row.integer(2), row.integer(3), row.integer(4),
                               row.integer(5)};
  if (!packed.open(shape, row.blob(6))) return false;
  held_.values.resize(packed.size());
  held_.offsets.resize(packed.size());
  packed.unpackValues(0, held_.values);
  packed.unpackOffsets(row.blob(8), 0, held_.offsets);
  if (packed.isWeighted()) {
    held_.weights.resize(packed.size());
    packed.unpackWeights(row.blob(7), 0, held_.weights);
  }
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
  return database_->error("the samples of " + key_ + " are numbered out of range");
}

Status SampleTail::append(const SampleColumns& samples) {
  for (std::size_t first = 0; first < samples.values.size();) {
    const auto part = slice(samples, first, capacity_ - held_.size());
    held_.append(part);
    first += part.values.size();
    if (held_.size() < capacity_) break;
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
  const SampleColumns samples = held_.columns();
  put_.bind(1, std::int64_t{day_})
      .bind(2, key_)
      .bind(3, number_)
      .bind(4, std::ssize(held_.values))
      .bind(5, static_cast<std::int64_t>(weightOf(samples)));
  PackedRow row;
  std::vector<std::byte> blob;
  if (isSeries_) {
    row = packRow(samples);
    put_.bind(6, std::span(row.values)).bind(7, std::span(row.weights));
    put_.bind(8, std::span(row.offsets));
  } else {
    blob = packSamples(samples);
    put_.bind(6, std::span(blob));
  }
  return put_.run() ? Status(Done{}) : database_->error();
}

}  // namespace tally
