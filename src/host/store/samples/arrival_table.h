// Adds to the table `arrivals`.
#pragma once

#include <cstdint>
#include <string_view>

#include "host/store/sqlite_database.h"
#include "platform/recording/recording_store.h"

namespace tally {

// New samples in the order of their arrival, until a checkpoint puts them in order: a commit of
// many keys fills a few pages that follow each other.
class ArrivalTable {
 public:
  // The database is borrowed. Makes the table if it is missing. REQUIRES: a transaction of a
  // writer; after it was undone, what was opened is of no use.
  static Result<ArrivalTable> open(Database& database);

  // REQUIRES: a key of the store.
  Status add(std::int32_t day, std::string_view key, const SampleColumns& samples);

 private:
  explicit ArrivalTable(Database& database) : database_(&database) {}

  Database* database_;
  Statement add_;
};

}  // namespace tally
