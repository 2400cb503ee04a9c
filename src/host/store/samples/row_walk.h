// Walks along the tables of samples.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <utility>

#include "host/store/samples/sample_source.h"
#include "host/store/sqlite_database.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {

// Of SQL: whether samples of a key are wanted.
constexpr const char* kWantedFunction = "tally_wanted";

// False, after a fault, if the text cannot be prepared.
bool prepareOrFail(Database& database, StoreFaults& faults, Statement& statement,
                   const std::string& text);

// A walk along a table whose primary key is (day, key, number). Finding a row anew costs the
// database several of its neighbours with all their blobs, so that a row is read, blob and all,
// when the walk comes to it; of keys that are not wanted the blob stays on the disk.
class RowWalk {
 public:
  RowWalk(Database& database, StoreFaults& faults) : database_(database), faults_(faults) {}

  // The columns that tell whether a row is sound, and its blob. False if the table cannot be read.
  bool open(std::string_view table, std::string_view columns, std::string_view blob,
            const StoreRange& range, bool filtered);

  // Goes on to the next row that is sound and wanted; false at the end. isSound is given the row
  // and its first column of those of open().
  template <class IsSound>
  bool next(const IsSound& isSound) {
    Step step = Step::Done;
    while ((step = rows_.step()) == Step::Row) {
      if (!order_.follows(rows_, day(), key(), number())) {
        faults_.fail(damagedTree(database_));
        return false;
      }
      if (!isStoreKey(key()) || !isSound(rows_, kFirstColumn)) {
        faults_.addDamaged(key(), day());
      } else if (!blob().empty()) {
        return true;
      }
    }
    if (step == Step::Failed) faults_.fail(database_.error());
    return false;
  }

  std::int64_t day() const { return rows_.integer(0); }
  std::string_view key() const { return rows_.text(1); }
  std::int64_t number() const { return rows_.integer(2); }
  std::span<const std::byte> blob() const { return rows_.blob(3); }
  const Statement& row() const { return rows_; }
  static constexpr int kFirstColumn = 4;

 private:
  Database& database_;
  StoreFaults& faults_;
  Statement rows_;
  RowOrder order_;
};

// Which rows of a walk belong to the key whose samples are read.
class OpenKey {
 public:
  void open(bool isHere) {
    isOpen_ = isHere;
    isTaken_ = false;
  }
  void close() { isOpen_ = false; }
  // The row where the source is, then each that follows; false when the next is of another key.
  bool takeRow(SampleSource& source) {
    if (!isOpen_) return false;
    if (!std::exchange(isTaken_, true)) return true;
    const std::int32_t day = source.place().first;
    key_ = source.place().second;
    source.advance();
    return isOpen_ = !source.atEnd() && source.place() == SamplePlace(day, key_);
  }

 private:
  bool isOpen_ = false, isTaken_ = false;
  std::string key_;
};

}  // namespace tally
