// The samples of one key in memory, in the order of their arrival: two or three bytes each where
// they are whole numbers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "platform/recording/recording_store.h"

namespace tally {

// Unpacked samples.
struct StreamSamples {
  std::vector<double> values;
  std::vector<std::uint32_t> offsets, weights;
  SampleColumns columns() const { return {values, offsets, weights}; }
  void clear();
};

class SampleStream {
 public:
  // Returns by how many bytes memory grew. REQUIRES: the value is not a NaN; weight >= 1.
  std::size_t add(double value, std::uint32_t offset, std::uint32_t weight);
  std::uint64_t count() const { return count_; }
  bool empty() const { return count_ == 0; }
  // Of the packed samples; what count() and the object itself take is not included.
  std::size_t bytes() const { return bytes_; }

  // Reads the samples from the first on.
  class Reader {
   public:
    explicit Reader(const SampleStream& stream);
    // Replaces the vectors' content by up to `most` further samples; false at the end.
    bool next(StreamSamples& samples, std::size_t most);

   private:
    std::byte take();
    std::uint64_t takeNumber();
    const SampleStream& stream_;
    std::size_t block_ = 0, position_ = 0;
    std::uint64_t left_;
    std::uint32_t offset_ = 0, weight_ = 1;
  };

  // Adds another one's samples after its own; by how many bytes memory grew.
  std::size_t append(const SampleStream& other);
  // Drops every second sample; the ones that stay count for them. Returns how many went.
  std::uint64_t thin();

 private:
  struct Block {
    std::unique_ptr<std::byte[]> data;
    std::uint32_t used = 0, capacity = 0;
  };
  std::byte* reserve(std::size_t most, std::size_t& grown);

  std::vector<Block> blocks_;
  std::uint64_t count_ = 0;
  std::size_t bytes_ = 0;
  std::uint32_t offset_ = 0, weight_ = 1;
};

}  // namespace tally
