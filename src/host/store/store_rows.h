// Reads rows from a file that may be hostile.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "host/store/sqlite_database.h"

namespace tally {

// The columns of a chunk, without loading one that is longer than any chunk may have.
constexpr std::string_view kBoundedValues =
    "iif(length(sample_values) <= 8388608, sample_values, NULL)";
constexpr std::string_view kBoundedOffsets =
    "iif(length(sample_offsets) <= 4194304, sample_offsets, NULL)";

// Ensures that a walk along a tree ends: in a damaged file pages may form a loop, but rows in
// rising order cannot repeat. Checking a few of them is enough.
class RowOrder {
 public:
  // Whether the row, whose second column is the key, comes after the one before. A number tells
  // rows of one key apart.
  bool follows(const Statement& row, std::int64_t day, std::string_view key,
               std::int64_t number = 0) {
    if (rows_++ % kRowsBetweenLooks != 0) return true;
    const bool sameDay = started_ && day == day_;
    const int compared = sameDay ? key.compare(key_) : !started_ || day > day_ ? 1 : -1;
    bool rises = compared > 0 || (compared == 0 && number > number_);
    blobs_ = blobs_ && sameDay;
    // Damaged keys that are not texts come after those that are.
    if (!rises && sameDay && !blobs_ && row.type(1) == ColumnType::Blob) rises = blobs_ = true;
    started_ = true;
    day_ = day;
    number_ = number;
    if (compared != 0) key_ = key;
    return rises;
  }

 private:
  static constexpr std::size_t kRowsBetweenLooks = 32;
  std::size_t rows_ = 0;
  bool started_ = false, blobs_ = false;
  std::int64_t day_ = 0, number_ = 0;
  std::string key_;
};

inline Error damagedTree(const Database& database) {
  return database.error("its rows are out of order; the file is damaged");
}

}  // namespace tally
