#include "host/store/samples/number_column.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>

#include "base/byte_reader.h"

namespace tally {
namespace {

static_assert(std::endian::native == std::endian::little, "columns are little endian");

// Of an exception: the number's index and its bits above the width.
constexpr std::size_t kBytesOfException = sizeof(std::uint16_t) + sizeof(std::uint32_t);
constexpr unsigned kBitsOfException = 32;
constexpr unsigned kMostBits = 56;

std::size_t bytesOfBits(std::size_t count, unsigned width) { return (count * width + 7) / 8; }

std::uint64_t maskOf(unsigned width) { return (std::uint64_t{1} << width) - 1; }

template <class T>
T load(const std::byte* from) {
  T number;
  std::memcpy(&number, from, sizeof number);
  return number;
}

template <class T>
void putPart(std::vector<std::byte>& column, T number) {
  const auto bytes = std::bit_cast<std::array<std::byte, sizeof(T)>>(number);
  column.insert(column.end(), bytes.begin(), bytes.end());
}

// Two of what a processor computes at once.
using Pair = double __attribute__((vector_size(16)));
using Words = std::uint64_t __attribute__((vector_size(16)));

// A number below 2^52 in the low bits of this double is added to it exactly.
constexpr double kWhole = 0x1p52;

// Pairs of numbers from first on, of which each may load 8 bytes. A narrow pair takes one load.
template <bool kNarrow, bool kDivided>
void quotientsOfPairs(const std::byte* bits, unsigned width, std::size_t first, double least,
                      double divisor, double* out, std::size_t pairs) {
  const std::uint64_t mask = maskOf(width), whole = std::bit_cast<std::uint64_t>(kWhole);
  std::size_t bit = first * width;
  for (std::size_t i = 0; i < pairs; ++i, bit += 2 * std::size_t{width}) {
    const std::uint64_t low = load<std::uint64_t>(bits + bit / 8) >> (bit % 8);
    const std::size_t next = bit + width;
    const std::uint64_t high =
        kNarrow ? low >> width : load<std::uint64_t>(bits + next / 8) >> (next % 8);
    Words words = {low, high};
    words = (words & mask) | whole;
    Pair pair;
    std::memcpy(&pair, &words, sizeof pair);
    pair = pair - kWhole + least;
    if (kDivided) pair /= divisor;
    std::memcpy(out + 2 * i, &pair, sizeof pair);
  }
}

}  // namespace

std::size_t NumberLayout::bytes(std::size_t count) const {
  return bytesOfBits(count, width) + exceptions * kBytesOfException;
}

NumberLayout narrowestLayout(std::span<const std::uint64_t> numbers) {
  std::array<std::size_t, kMostBits + 1> countOfWidth{};
  for (const std::uint64_t number : numbers) {
    ++countOfWidth[std::min(static_cast<unsigned>(std::bit_width(number)), kMostBits)];
  }
  unsigned widest = kMostBits;
  while (widest > 0 && countOfWidth[widest] == 0) --widest;
  NumberLayout best;
  std::size_t exceptions = 0, least = SIZE_MAX;
  for (unsigned width = widest;; --width) {
    const NumberLayout layout{static_cast<std::uint8_t>(width),
                              static_cast<std::uint16_t>(exceptions)};
    const std::size_t bytes = layout.bytes(numbers.size());
    if (width <= NumberLayout::kWidest && bytes < least) {
      best = layout;
      least = bytes;
    }
    if (width == 0 || width + kBitsOfException == widest) return best;
    exceptions += countOfWidth[width];
  }
}

void putNumbers(std::vector<std::byte>& column, const NumberLayout& layout,
                std::span<const std::uint64_t> numbers) {
  const std::uint64_t mask = maskOf(layout.width);
  const std::size_t start = column.size(), bytes = bytesOfBits(numbers.size(), layout.width);
  column.resize(start + bytes + sizeof mask);  // each is put as a whole word
  std::byte* const to = column.data() + start;
  std::size_t bit = 0;
  for (const std::uint64_t number : numbers) {
    const std::uint64_t word = load<std::uint64_t>(to + bit / 8) | (number & mask) << (bit % 8);
    std::memcpy(to + bit / 8, &word, sizeof word);
    bit += layout.width;
  }
  column.resize(start + bytes);
  for (std::size_t i = 0; i < numbers.size(); ++i) {
    if (numbers[i] <= mask) continue;
    putPart(column, static_cast<std::uint16_t>(i));
    putPart(column, static_cast<std::uint32_t>(numbers[i] >> layout.width));
  }
}

std::uint64_t NumberColumn::bitsOf(std::size_t index) const {
  const std::size_t bit = index * layout_.width, at = bit / 8;
  std::uint64_t word = 0;
  if (at < bytes_.size()) {
    std::memcpy(&word, &bytes_[at], std::min(sizeof word, bytes_.size() - at));
  }
  return (word >> (bit % 8)) & maskOf(layout_.width);
}

std::size_t NumberColumn::numbersBeforeEnd() const {
  if (bytes_.size() < sizeof(std::uint64_t)) return 0;
  if (layout_.width == 0) return count_;
  const std::size_t places = bytes_.size() - sizeof(std::uint64_t) + 1;
  return std::min(count_, (places * 8 - 1) / layout_.width + 1);
}

template <class Handler>
void NumberColumn::eachException(std::size_t first, std::size_t end, const Handler& handler) const {
  const std::size_t start = bytesOfBits(count_, layout_.width);
  const ByteReader reader(bytes_);
  const auto indexOf = [&](std::size_t i) -> std::size_t {
    return reader.read<std::uint16_t>(start + i * kBytesOfException).value_or(UINT16_MAX);
  };
  std::size_t low = 0, high = layout_.exceptions;  // in rising order, unless the file is hostile
  while (low < high) {
    const std::size_t middle = (low + high) / 2;
    if (indexOf(middle) < first) {
      low = middle + 1;
    } else {
      high = middle;
    }
  }
  for (; low < layout_.exceptions; ++low) {
    const std::size_t index = indexOf(low);
    if (index >= end) return;
    if (index < first) continue;
    const std::size_t at = start + low * kBytesOfException + sizeof(std::uint16_t);
    const std::uint64_t upper = reader.read<std::uint32_t>(at).value_or(0);
    handler(index, bitsOf(index) | upper << layout_.width);
  }
}

void NumberColumn::unpack(std::size_t first, std::span<std::uint32_t> out) const {
  const std::size_t direct = std::min(std::max(numbersBeforeEnd(), first) - first, out.size());
  const std::uint64_t mask = maskOf(layout_.width);
  std::size_t bit = first * layout_.width, i = 0;
  for (; i < direct; ++i, bit += layout_.width) {
    out[i] = static_cast<std::uint32_t>(
        (load<std::uint64_t>(bytes_.data() + bit / 8) >> (bit % 8)) & mask);
  }
  for (; i < out.size(); ++i) out[i] = static_cast<std::uint32_t>(bitsOf(first + i));
  eachException(first, first + out.size(), [&](std::size_t index, std::uint64_t number) {
    out[index - first] = static_cast<std::uint32_t>(number);
  });
}

void NumberColumn::unpackQuotients(std::size_t first, std::int64_t least, double divisor,
                                   std::span<double> out) const {
  constexpr unsigned kNarrow = (64 - 7) / 2;  // two and what precedes them in their byte: one load
  const std::size_t direct = std::min(std::max(numbersBeforeEnd(), first) - first, out.size());
  auto* const pairs =
      layout_.width <= kNarrow
          ? (divisor == 1 ? quotientsOfPairs<true, false> : quotientsOfPairs<true, true>)
          : (divisor == 1 ? quotientsOfPairs<false, false> : quotientsOfPairs<false, true>);
  pairs(bytes_.data(), layout_.width, first, static_cast<double>(least), divisor, out.data(),
        direct / 2);
  const auto take = [&](std::size_t index, std::uint64_t number) {
    const auto whole = static_cast<std::int64_t>(static_cast<std::uint64_t>(least) + number);
    out[index - first] = static_cast<double>(whole) / divisor;
  };
  for (std::size_t i = direct / 2 * 2; i < out.size(); ++i) take(first + i, bitsOf(first + i));
  eachException(first, first + out.size(), take);
}

}  // namespace tally
