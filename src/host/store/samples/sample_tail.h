// The end of a key's samples in a table of full rows, while more are being appended.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "host/store/samples/packed_samples.h"
#include "host/store/sqlite_database.h"

namespace tally {

class SampleTail {
 public:
  enum class Table { Chunks, Packed };
  // The database is borrowed. Makes the table if it is missing. REQUIRES: a transaction of a
  // writer; after it was undone, the tail of a table that it made is of no use.
  static Result<SampleTail> open(Database& database, Table table);

  // Continues the key's last row if it has space, else starts a new one.
  Status moveTo(std::int32_t day, std::string_view key);
  // REQUIRES: no weights in chunks.
  Status append(const SampleColumns& samples);
  // Writes what has been taken up and not filled.
  Status finish();

 private:
  SampleTail(Database& database, Table table) : database_(&database), table_(table) {}
  // Takes up the samples of the row in hand. False if it has no space, or is damaged.
  bool take(const Statement& row);
  Status write();

  Database* database_;
  Table table_;
  Statement last_, put_;
  std::int32_t day_ = 0;
  std::string key_;
  std::int64_t number_ = 0;
  SampleVectors held_;
};

}  // namespace tally
