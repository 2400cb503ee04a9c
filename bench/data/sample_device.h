// A device with a large day of data, for the benchmarks.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>

#include "kv/value.h"

namespace tally::bench {

struct SampleDay {
  std::int32_t day = 0;
  std::size_t scalars = 100'000;
  std::size_t distributions = 1'000;
  std::size_t samplesEach = 10'000;

  static std::string scalarKey(std::size_t index);
  static std::string distributionKey(std::size_t index);
  static std::int64_t scalar(std::size_t index);
  // The sample of a distribution, with three decimals; always the same one.
  static double sample(std::size_t distribution, std::size_t index);
  std::uint32_t offset(std::size_t index) const;
  // Every second distribution has 20 boundaries.
  static KvRef<KvDictionary> distributionOptions(std::size_t index);
};

// Yesterday, by the system's clock.
std::int32_t yesterday();

// A device root with the day in its store and a whitelist that names every key; false on failure.
bool makeDevice(const std::string& root, const SampleDay& day);
std::string whitelistPath(const std::string& root);
// The same day in a database with a row for each sample, in the order of their recording.
bool makeRowDatabase(const std::string& path, const SampleDay& day);
// A store that has the day's samples as they are, of schema version 1.
bool makeRawDevice(const std::string& root, const SampleDay& day);
// And as CSV, key by key.
bool makeCsv(const std::string& path, const SampleDay& day);

}  // namespace tally::bench
