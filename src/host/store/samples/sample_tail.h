// The end of a key's samples in the table where they lie in order, while more are being appended.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "host/store/samples/packed_samples.h"
#include "host/store/samples/sample_row.h"
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
  SampleTail(Database& database, bool isSeries) : database_(&database), isSeries_(isSeries) {}
  // Takes up the samples of the row in hand. False if it has no space, or is damaged.
  bool take(const Statement& row);
  // The bytes of the columns of a row that lies in its page alone.
  std::size_t shortRow() const;
  // How many of the samples one row should hold, which is then packed.
  std::size_t fill(const SampleColumns& samples);
  // Writes rows until at most so many samples are left.
  Status writeRows(std::size_t left);

  Database* database_;
  bool isSeries_;
  Statement last_, put_;
  std::int32_t day_ = 0;
  std::string key_;
  std::int64_t number_ = 0;
  SampleVectors held_;
  // The row that was packed last, and how many samples it holds.
  PackedRow row_;
  std::vector<std::byte> blob_;
  std::size_t rowSamples_ = 1024;
};

}  // namespace tally
