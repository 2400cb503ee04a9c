// Brings many rows into the metrics store at once.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "host/store/store_writer.h"

namespace tally {

// All rows of one import are one transaction, which begins with the first row: an import that fails
// or is killed leaves the store as it was. Memory is bounded whatever the rows are: samples are
// gathered by key until there are many, so that they can be written as rows.
class StoreImporter {
 public:
  explicit StoreImporter(StoreFile file) : file_(std::move(file)) {}

  // REQUIRES: the key is one that the store can have. After a failure nothing more can be added.
  Status addScalar(std::int32_t day, std::string_view key, std::int64_t value);
  // The weight is how many samples it stands for, 1 or more.
  Status addSample(std::int32_t day, std::string_view key, std::uint32_t offset, double value,
                   std::uint32_t weight = 1);
  // Makes everything that was added visible. Without rows the store is not even created.
  Status finish();

 private:
  struct Place {
    std::int32_t day;
    std::string key;
  };
  Status ensureBegun();
  std::uint32_t placeOf(std::int32_t day, std::string_view key);
  Status writeSamples();

  StoreFile file_;
  std::optional<StoreWriter> writer_;
  // The samples in hand in the order of their arrival, each with its place.
  std::vector<std::uint32_t> placeOfSample_, offsets_, weights_;  // no weights: each counts once
  std::vector<double> values_;
  std::vector<Place> places_;
  std::unordered_map<std::string, std::uint32_t> placeNumbers_;  // by day and key
  std::string placeName_;
  std::uint32_t lastPlace_ = 0;
  std::size_t placeBytes_ = 0;
};

}  // namespace tally
