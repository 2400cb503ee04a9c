// A store of schema version 1, whose samples lie in chunks as they are: what is compared with.
#pragma once

#include <optional>
#include <string_view>

#include "host/store/store_schema.h"
#include "platform/recording/recording_store.h"

namespace tally::bench {

class RawStore {
 public:
  // Makes one; empty on failure.
  static std::optional<RawStore> make(const StoreFile& file);
  bool addScalar(std::int32_t day, std::string_view key, std::int64_t value);
  // All samples of a key on a day; without weights.
  bool addSamples(std::int32_t day, std::string_view key, const SampleColumns& samples);
  bool finish();

 private:
  RawStore(Database database, Statement scalar, Statement chunk)
      : database_(std::move(database)), scalar_(std::move(scalar)), chunk_(std::move(chunk)) {}

  Database database_;
  Statement scalar_, chunk_;
};

}  // namespace tally::bench
