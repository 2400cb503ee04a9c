// Reads rows from a file that may be hostile.
#pragma once

#include <cstdint>
#include <functional>
#include <limits>
#include <string>
#include <string_view>
#include <utility>

#include "host/store/sqlite_database.h"

namespace tally {

// Far above what a key can have on a day; a number beyond it was not written by this program.
constexpr std::int64_t kMostRowsOfKey = std::numeric_limits<std::int32_t>::max();

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

// The least text above every one that begins with the prefix; empty when there is none.
inline std::string endOfPrefix(std::string_view prefix) {
  std::string end(prefix);
  while (!end.empty() && end.back() == '\xff') end.pop_back();
  if (!end.empty()) end.back() = static_cast<char>(static_cast<unsigned char>(end.back()) + 1);
  return end;
}

// The rows that an enumeration is asked for: of days in (minimum, maximum], and of keys that begin
// with the prefix, which is borrowed.
struct StoreRange {
  static constexpr std::string_view kCondition =
      " WHERE day > ?1 AND day <= ?2 AND key >= ?3 AND (?4 IS NULL OR key < ?4)";

  StoreRange(std::string_view keyPrefix, std::int64_t minimumDay, std::int64_t maximumDay)
      : prefix(keyPrefix), end(endOfPrefix(keyPrefix)), minimum(minimumDay), maximum(maximumDay) {}
  void bindTo(Statement& statement) const {
    statement.bind(1, minimum).bind(2, maximum).bind(3, prefix);
    if (!end.empty()) statement.bind(4, std::string_view(end));
  }
  std::string_view prefix;
  std::string end;
  std::int64_t minimum, maximum;
};

// What a reader of the store did not get to see.
struct StoreLosses {
  std::uint64_t damagedRows = 0;
  bool isComplete = true;  // else nobody knows how many more
  // Is told of each damaged row, unless it is empty.
  std::function<void(std::string_view key, std::int64_t day)> onDamaged;
};

// Counts what one enumeration leaves out, and reports it as one line.
class StoreFaults {
 public:
  // The losses, which may be null, are added to.
  StoreFaults(const Database& database, const std::function<void(const std::string&)>& report,
              StoreLosses* losses = nullptr)
      : database_(database), report_(report), losses_(losses) {}
  ~StoreFaults() {
    if (losses_ != nullptr) {
      losses_->damagedRows += damaged_;
      losses_->isComplete = losses_->isComplete && !failed_;
    }
    if (failed_) {
      report_(reason_);
    } else if (damaged_ > 0) {
      report_(database_
                  .error(std::to_string(damaged_) + " damaged rows are left out, the first for " +
                         reason_)
                  .message);
    }
  }
  StoreFaults(const StoreFaults&) = delete;
  StoreFaults& operator=(const StoreFaults&) = delete;

  void addDamaged(std::string_view key, std::int64_t day) {
    if (losses_ != nullptr && losses_->onDamaged) losses_->onDamaged(key, day);
    if (damaged_++ == 0)
      reason_ = "the key \"" + std::string(key) + "\" on day " + std::to_string(day);
  }
  // Nothing after this could be read.
  void fail(const Error& error) {
    if (!std::exchange(failed_, true)) reason_ = error.message;
  }

 private:
  const Database& database_;
  const std::function<void(const std::string&)>& report_;
  StoreLosses* const losses_;
  std::size_t damaged_ = 0;
  bool failed_ = false;
  std::string reason_;
};

inline Error damagedTree(const Database& database) {
  return database.error("its rows are out of order; the file is damaged");
}

}  // namespace tally
