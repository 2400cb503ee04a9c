// How rows are read from a file that may have been made to harm its reader.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/linux/sqlite_database.h"

namespace tally {

// The columns of a chunk, without loading one that is longer than any chunk may have.
constexpr std::string_view kBoundedValues =
    "iif(length(sample_values) <= 8388608, sample_values, NULL)";
constexpr std::string_view kBoundedOffsets =
    "iif(length(sample_offsets) <= 4194304, sample_offsets, NULL)";

// Sees to it that a walk along a tree has an end: in a damaged file pages may lead back to each
// other, but rows that only rise cannot repeat.
class RowOrder {
 public:
  // Whether the row, whose first two columns are day and key, comes after the one before. A number
  // in a further column tells rows of one key apart.
  bool follows(const Statement& row, int numberColumn = -1) {
    const std::int64_t day = row.integer(0);
    const ColumnType type = row.type(1);
    const std::string_view key = row.text(1);
    const std::int64_t number = numberColumn < 0 ? 0 : row.integer(numberColumn);
    const int compared = !started_ || day != day_ ? (!started_ || day > day_ ? 1 : -1)
                         : type != type_          ? (type > type_ ? 1 : -1)
                                                  : key.compare(key_);
    const bool rises = compared > 0 || (compared == 0 && numberColumn >= 0 && number > number_);
    started_ = true;
    day_ = day;
    type_ = type;
    if (compared != 0) key_ = key;
    number_ = number;
    return rises;
  }

 private:
  bool started_ = false;
  std::int64_t day_ = 0, number_ = 0;
  ColumnType type_ = ColumnType::Null;
  std::string key_;
};

inline Error damagedTree(const Database& database) {
  return database.error("its rows are out of order; the file is damaged");
}

}  // namespace tally
