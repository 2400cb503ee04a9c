// A row of the table `series`: successive samples of a key on a day in three columns, each in the
// narrowest form in which it comes back bit for bit. Values come first, since most passes read
// nothing else, and begin with what the forms of all columns are; weights are empty where each
// sample counts once.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "host/store/samples/number_column.h"
#include "platform/recording/recording_store.h"

namespace tally {

// Of a row in which hardly anything changes; others hold fewer, since they would be too long.
constexpr std::size_t kMostRowSamples = 16384;

struct PackedRow {
  std::vector<std::byte> values, weights, offsets;

  std::size_t bytes() const { return values.size() + weights.size() + offsets.size(); }
};
// REQUIRES: 1 to kMostRowSamples samples.
PackedRow packRow(const SampleColumns& samples);

// The columns of a row, without loading one that is longer than any.
constexpr std::string_view kBoundedRowValues =
    "iif(length(sample_values) <= 131083, sample_values, NULL)";
constexpr std::string_view kBoundedRowWeights =
    "iif(length(sample_weights) <= 65540, sample_weights, NULL)";
constexpr std::string_view kBoundedRowOffsets =
    "iif(length(sample_offsets) <= 65544, sample_offsets, NULL)";

// Unpacks any part of a row. Columns are borrowed; their bytes may be hostile.
class SampleRow {
 public:
  struct Shape {
    std::int64_t samples = 0, weight = 0;  // as the row counts them
    std::int64_t valueBytes = 0, weightBytes = 0, offsetBytes = 0;

    // Whether a row may have that shape, whatever its values are.
    bool isPossible() const;
    // REQUIRES: it is possible.
    std::size_t bytes() const {
      return static_cast<std::size_t>(valueBytes + weightBytes + offsetBytes);
    }
  };
  // Whether the row can be unpacked: what the values begin with fits the shape.
  bool open(const Shape& shape, std::span<const std::byte> values);

  std::size_t size() const { return size_; }
  bool isWeighted() const { return isWeighted_; }

  // The samples from first on, as many as out holds. REQUIRES: so many are in the row that was
  // opened. Of a column that could not be loaded, weights are 1 and offsets 0.
  void unpackValues(std::size_t first, std::span<double> out) const;
  void unpackWeights(std::span<const std::byte> column, std::size_t first,
                     std::span<std::uint32_t> out) const;
  // Quick where the last call ended, since each adds to the one before.
  void unpackOffsets(std::span<const std::byte> column, std::size_t first,
                     std::span<std::uint32_t> out);

 private:
  std::size_t size_ = 0;
  bool isWeighted_ = false;
  std::uint8_t form_ = 0, scale_ = 0;
  NumberLayout values_, weights_, offsets_;
  std::span<const std::byte> data_;  // of the values, after the header
  // Which offset follows, and the one before it.
  std::size_t nextOffset_ = 0;
  std::uint32_t lastOffset_ = 0;
};

}  // namespace tally
