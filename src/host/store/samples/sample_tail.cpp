#include "host/store/samples/sample_tail.h"

#include <algorithm>

#include "host/store/samples/sample_row.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {

namespace {

// A row of up to 2030 bytes takes a fourth of a page of 8 KiB. Of a longer one, pages of its own
// take what is beyond 1000 to 2030 bytes; what stays empty of the last is wasted, so that rows are
// made to fill them. Finding a row compares whole rows, so that none is longer than it has to be
// for quick reading.
constexpr std::size_t kLeastInPage = 1000, kBytesInPage = 2030, kBytesOfOwnPage = 8188,
                      kMostOwnPages = 2;
constexpr std::size_t kBytesBesideColumns = 40;  // and beside the key
constexpr std::size_t kMostMissing = 120;        // of a row that is full

// Guesses of how many samples fill a row; then it may stay shorter.
constexpr int kMostAttempts = 6;

constexpr std::size_t kMostHeld = 2 * kMostRowSamples;

bool isFull(std::size_t bytes, std::size_t target) { return bytes + kMostMissing >= target; }

}  // namespace

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
  if (!isSeries_) {
    return samples < static_cast<std::int64_t>(kMostPackedSamples) &&
           unpackSamples(row.blob(3), PackedColumns::All, held_);
  }
  SampleRow packed;
  const SampleRow::Shape shape{samples, row.integer(2), row.integer(3), row.integer(4),
                               row.integer(5)};
  if (!packed.open(shape, row.blob(6)) || isFull(shape.bytes(), shortRow())) return false;
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

std::size_t SampleTail::shortRow() const {
  return kBytesInPage - kBytesBesideColumns - std::min(key_.size(), kBytesInPage / 4);
}

std::size_t SampleTail::fill(const SampleColumns& samples) {
  const std::size_t most = std::min(samples.values.size(), kMostRowSamples);
  std::size_t count = std::min(rowSamples_, most);
  for (int attempt = 0;; ++attempt) {
    row_ = packRow(slice(samples, 0, count));
    const std::size_t bytes = row_.bytes(), all = bytes * most / count;
    const std::size_t ownPages =
        std::min(all - std::min(all, kLeastInPage), kMostOwnPages * kBytesOfOwnPage) /
        kBytesOfOwnPage;
    const std::size_t target = shortRow() + ownPages * kBytesOfOwnPage;
    // The middle of what is full, for the next row too.
    const std::size_t fitting =
        std::clamp<std::size_t>(count * (target - kMostMissing / 2) / bytes, 1, kMostRowSamples);
    if (bytes > target && count > 1) {
      count = attempt < kMostAttempts ? std::min(fitting, count - 1) : count / 2;
      continue;
    }
    if (count == most || isFull(bytes, target) || attempt >= kMostAttempts) {
      rowSamples_ = fitting;
      return count;
    }
    count = std::clamp(fitting, count + 1, most);
  }
}

Status SampleTail::writeRows(std::size_t left) {
  std::size_t written = 0;
  while (held_.size() - written > left) {
    const SampleColumns rest = slice(held_.columns(), written, kMostHeld);
    std::size_t count = std::min(rest.values.size(), kMostPackedSamples);
    if (isSeries_) count = fill(rest);
    const SampleColumns part = slice(rest, 0, count);
    put_.bind(1, std::int64_t{day_})
        .bind(2, key_)
        .bind(3, number_)
        .bind(4, static_cast<std::int64_t>(count))
        .bind(5, static_cast<std::int64_t>(weightOf(part)));
    if (isSeries_) {
      put_.bind(6, std::span(row_.values)).bind(7, std::span(row_.weights));
      put_.bind(8, std::span(row_.offsets));
    } else {
      blob_ = packSamples(part);
      put_.bind(6, std::span(blob_));
    }
    if (!put_.run()) return database_->error();
    written += count;
    ++number_;
  }
  SampleVectors rest;
  rest.append(slice(held_.columns(), written, kMostHeld));
  held_ = std::move(rest);
  return Done{};
}

Status SampleTail::append(const SampleColumns& samples) {
  for (std::size_t first = 0; first < samples.values.size();) {
    const auto part = slice(samples, first, kMostHeld - held_.size());
    held_.append(part);
    first += part.values.size();
    if (held_.size() < kMostHeld) break;
    if (auto written = writeRows(kMostRowSamples); !written) return written;
  }
  return Done{};
}

Status SampleTail::finish() { return writeRows(0); }

}  // namespace tally
