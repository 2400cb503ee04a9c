// Whole numbers in a few bits each: as many as most of them need. The few that need more are
// exceptions, whose upper bits follow: one outlier does not make all numbers wide.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace tally {

struct NumberLayout {
  std::uint8_t width = 0;  // bits, lowest first, without gaps
  std::uint16_t exceptions = 0;

  static constexpr unsigned kWidest = 52;
  std::size_t bytes(std::size_t count) const;
};

// The layout that takes the least space. REQUIRES: at most 65535 numbers below 2^56.
NumberLayout narrowestLayout(std::span<const std::uint64_t> numbers);
void putNumbers(std::vector<std::byte>& column, const NumberLayout& layout,
                std::span<const std::uint64_t> numbers);

// Reads such numbers, which may be hostile: any bytes are numbers, and missing ones are 0.
// REQUIRES: the width is at most kWidest, and no number is asked for beyond the count.
class NumberColumn {
 public:
  NumberColumn(std::span<const std::byte> bytes, std::size_t count, const NumberLayout& layout)
      : bytes_(bytes), count_(count), layout_(layout) {}

  // The numbers from first on, as many as out holds; their low 32 bits.
  void unpack(std::size_t first, std::span<std::uint32_t> out) const;
  // The same, each as (least + number) / divisor.
  void unpackQuotients(std::size_t first, std::int64_t least, double divisor,
                       std::span<double> out) const;

 private:
  // The bits of one number, without those of an exception.
  std::uint64_t bitsOf(std::size_t index) const;
  // How many numbers are at least 8 bytes before the column's end, so that they take one load.
  std::size_t numbersBeforeEnd() const;
  // handler(index, number) for each exception in the range.
  template <class Handler>
  void eachException(std::size_t first, std::size_t end, const Handler& handler) const;

  std::span<const std::byte> bytes_;
  std::size_t count_;
  NumberLayout layout_;
};

}  // namespace tally
