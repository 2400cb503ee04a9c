// Samples in blobs, each of which describes itself.
#pragma once

#include <optional>
#include <span>

#include "host/store/samples/packed_samples.h"
#include "host/store/samples/sample_source.h"
#include "host/store/store_rows.h"

namespace tally {

// Which row is next is known to the derived class.
class BlobSource : public SampleSource {
 public:
  std::size_t nextValues(double* values, std::uint32_t* offsets, std::size_t capacity) final;
  std::span<const std::uint32_t> weights() const final {
    return slice(held_.columns(), first_, count_).weights;
  }

 protected:
  BlobSource(Database& database, StoreFaults& faults) : database_(database), faults_(faults) {}

  // The blob of the next row, valid until the next call; empty at the end.
  virtual std::optional<std::span<const std::byte>> nextBlob() = 0;

  void clear() {
    held_.clear();
    first_ = count_ = 0;
  }
  void fail(const Error& error) {
    end();
    faults_.fail(error);
  }

  Database& database_;
  StoreFaults& faults_;

 private:
  bool nextRow(bool withOffsets);

  // The row in hand, and what of it was delivered last.
  std::span<const std::byte> blob_;
  SampleVectors held_;
  std::size_t first_ = 0, count_ = 0;
};

}  // namespace tally
