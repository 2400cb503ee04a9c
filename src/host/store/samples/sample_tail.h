// The end of a key's samples in the table where they lie in order, while more are being appended.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "host/store/samples/packed_samples.h"
#include "host/store/sqlite_database.h"

namespace tally {

class SampleTail {
 public:
  // The database is borrowed. The table is `series`, or that of packed rows of a store that lacks
  // it, which is made if it is missing. REQUIRES: a transaction of a writer; after it was undone,
  // what was opened is of no use.
  static Result<SampleTail> open(Database& database);

  // Continues the key's last row if it has space, else starts a new one.
  Status moveTo(std::int32_t day, std::string_view key);
  Status append(const SampleColumns& samples);
  // Writes what has been taken up and not filled.
  Status finish();

 private:
  SampleTail(Database& database, bool isSeries);
  // Takes up the samples of the row in hand. False if it has no space, or is damaged.
  bool take(const Statement& row);
  Status write();

  Database* database_;
  bool isSeries_;
  std::size_t capacity_;  // of a row
  Statement last_, put_;
  std::int32_t day_ = 0;
  std::string key_;
  std::int64_t number_ = 0;
  SampleVectors held_;
};

}  // namespace tally
