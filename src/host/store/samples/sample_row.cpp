#include "host/store/samples/sample_row.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <limits>

#include "base/byte_reader.h"
#include "host/store/samples/decimals.h"

namespace tally {
namespace {

// The column of values, little endian: the form, the decimal scale, then the layouts of the numbers
// that are values, weights and differences of offsets: the width (8 bits) and the exceptions (16
// bits) of each. Then of a constant the value, of decimals the least one's digits (64 bits) and the
// numbers by which each exceeds them.
enum RowForm : std::uint8_t { kOneValue, kDecimals, kFloats, kDoubles };
constexpr std::size_t kBytesOfLayout = 3;
constexpr std::size_t kHeader = 2 + 3 * kBytesOfLayout;

// Weights: the least one (32 bits), and the numbers by which each exceeds it.
constexpr std::size_t kBytesOfLeastWeight = sizeof(std::uint32_t);
// Offsets: the first one, the least difference from one to the next (32 bits each, modulo 2^32,
// since clocks may step back), and the numbers by which each difference exceeds it.
constexpr std::size_t kBytesBeforeOffsets = 2 * sizeof(std::uint32_t);

// The narrowest layout takes no more than numbers without exceptions.
constexpr std::size_t kMostBytesOfNumbers = kMostRowSamples * sizeof(std::uint32_t);
constexpr std::size_t kMostValueBytes = kHeader + kMostRowSamples * sizeof(double);

template <class T>
void putNumber(std::vector<std::byte>& column, T number) {
  const auto bytes = std::bit_cast<std::array<std::byte, sizeof(T)>>(number);
  column.insert(column.end(), bytes.begin(), bytes.end());
}

void putLayout(std::vector<std::byte>& column, std::size_t which, const NumberLayout& layout) {
  const std::size_t at = 2 + which * kBytesOfLayout;
  column[at] = std::byte{layout.width};
  std::memcpy(&column[at + 1], &layout.exceptions, sizeof layout.exceptions);
}

NumberLayout layoutAt(const ByteReader& reader, std::size_t which) {
  const std::size_t at = 2 + which * kBytesOfLayout;
  return {reader.read<std::uint8_t>(at).value_or(0xff),
          reader.read<std::uint16_t>(at + 1).value_or(0)};
}

void packValues(std::span<const double> values, std::vector<std::byte>& column) {
  const auto setForm = [&](RowForm form) { column[0] = std::byte{form}; };
  if (areEqual(values)) {
    setForm(kOneValue);
    return putNumber(column, values[0]);
  }
  const std::size_t floating = values.size() * (fitFloats(values) ? sizeof(float) : sizeof(double));
  if (const auto decimals = decimalsOf(values)) {
    const NumberLayout layout = narrowestLayout(decimals->excess);
    if (sizeof decimals->least + layout.bytes(values.size()) < floating) {
      setForm(kDecimals);
      column[1] = static_cast<std::byte>(decimals->scale);
      putLayout(column, 0, layout);
      putNumber(column, decimals->least);
      return putNumbers(column, layout, decimals->excess);
    }
  }
  if (floating == values.size_bytes()) {
    setForm(kDoubles);
    const auto bytes = std::as_bytes(values);
    column.insert(column.end(), bytes.begin(), bytes.end());
    return;
  }
  setForm(kFloats);
  for (const double value : values) putNumber(column, static_cast<float>(value));
}

// The numbers by which others exceed the least of them.
std::vector<std::uint64_t> excessesOf(std::span<const std::int64_t> numbers, std::int64_t& least) {
  least = numbers.empty() ? 0 : *std::ranges::min_element(numbers);
  std::vector<std::uint64_t> excesses;
  excesses.reserve(numbers.size());
  for (const std::int64_t number : numbers) {
    excesses.push_back(static_cast<std::uint64_t>(number - least));
  }
  return excesses;
}

}  // namespace

PackedRow packRow(const SampleColumns& samples) {
  PackedRow row;
  row.values.resize(kHeader);
  packValues(samples.values, row.values);

  std::int64_t least = 0;
  const bool isWeighted =
      std::ranges::any_of(samples.weights, [](std::uint32_t weight) { return weight != 1; });
  if (isWeighted) {
    const std::vector<std::int64_t> weights(samples.weights.begin(), samples.weights.end());
    const auto excesses = excessesOf(weights, least);
    const NumberLayout layout = narrowestLayout(excesses);
    putLayout(row.values, 1, layout);
    putNumber(row.weights, static_cast<std::uint32_t>(least));
    putNumbers(row.weights, layout, excesses);
  }

  std::vector<std::int64_t> differences;
  differences.reserve(samples.offsets.size());
  for (std::size_t i = 1; i < samples.offsets.size(); ++i) {
    differences.push_back(static_cast<std::int32_t>(samples.offsets[i] - samples.offsets[i - 1]));
  }
  const auto excesses = excessesOf(differences, least);
  const NumberLayout layout = narrowestLayout(excesses);
  putLayout(row.values, 2, layout);
  putNumber(row.offsets, samples.offsets[0]);
  putNumber(row.offsets, static_cast<std::int32_t>(least));
  putNumbers(row.offsets, layout, excesses);
  return row;
}

// As the texts of the queries say.
static_assert(kMostValueBytes == 131083);
static_assert(kBytesOfLeastWeight + kMostBytesOfNumbers == 65540);
static_assert(kBytesBeforeOffsets + kMostBytesOfNumbers == 65544);

bool SampleRow::Shape::isPossible() const {
  const auto isWithin = [](std::int64_t bytes, std::size_t least, std::size_t most) {
    return bytes >= static_cast<std::int64_t>(least) && bytes <= static_cast<std::int64_t>(most);
  };
  return samples >= 1 && samples <= static_cast<std::int64_t>(kMostRowSamples) &&
         isWithin(valueBytes, kHeader, kMostValueBytes) &&
         isWithin(weightBytes, 0, kBytesOfLeastWeight + kMostBytesOfNumbers) &&
         isWithin(offsetBytes, kBytesBeforeOffsets, kBytesBeforeOffsets + kMostBytesOfNumbers) &&
         (weightBytes > 0) == (weight != samples);
}

bool SampleRow::open(const Shape& shape, std::span<const std::byte> values) {
  size_ = 0;
  if (!shape.isPossible() || std::ssize(values) != shape.valueBytes) return false;
  const ByteReader reader(values);
  const auto count = static_cast<std::size_t>(shape.samples);
  form_ = reader.read<std::uint8_t>(0).value_or(0xff);
  scale_ = reader.read<std::uint8_t>(1).value_or(0xff);
  values_ = layoutAt(reader, 0);
  weights_ = layoutAt(reader, 1);
  offsets_ = layoutAt(reader, 2);
  if (scale_ >= std::size(kPowersOfTen)) return false;
  for (const NumberLayout& layout : {values_, weights_, offsets_}) {
    if (layout.width > NumberLayout::kWidest) return false;
  }
  data_ = values.subspan(kHeader);
  std::size_t bytes = 0;
  switch (form_) {
    case kOneValue:
      bytes = sizeof(double);
      break;
    case kDecimals: {
      const auto least = reader.read<std::int64_t>(kHeader);
      if (!least || *least >= kMostDigits || *least <= -kMostDigits) return false;
      bytes = sizeof *least + values_.bytes(count);
      break;
    }
    case kFloats:
      bytes = count * sizeof(float);
      break;
    case kDoubles:
      bytes = count * sizeof(double);
      break;
    default:
      return false;
  }
  isWeighted_ = shape.weightBytes > 0;
  const std::size_t weightBytes = isWeighted_ ? kBytesOfLeastWeight + weights_.bytes(count) : 0;
  const std::size_t offsetBytes = kBytesBeforeOffsets + offsets_.bytes(count - 1);
  if (data_.size() != bytes || static_cast<std::size_t>(shape.weightBytes) != weightBytes ||
      static_cast<std::size_t>(shape.offsetBytes) != offsetBytes) {
    return false;
  }
  size_ = count;
  nextOffset_ = 0;
  return true;
}

void SampleRow::unpackValues(std::size_t first, std::span<double> out) const {
  const ByteReader reader(data_);
  if (form_ == kOneValue) {
    std::ranges::fill(out, reader.read<double>(0).value_or(0));
    return;
  }
  if (form_ == kDecimals) {
    const std::int64_t least = reader.read<std::int64_t>(0).value_or(0);
    const NumberColumn numbers(data_.subspan(sizeof least), size_, values_);
    return numbers.unpackQuotients(first, least, kPowersOfTen[scale_], out);
  }
  if (form_ == kFloats) {
    for (std::size_t i = 0; i < out.size(); ++i) {
      out[i] = reader.read<float>((first + i) * sizeof(float)).value_or(0);
    }
    return;
  }
  const auto bytes = reader.slice(first * sizeof(double), out.size_bytes());
  if (bytes && !bytes->empty()) std::memcpy(out.data(), bytes->data(), bytes->size());
}

void SampleRow::unpackWeights(std::span<const std::byte> column, std::size_t first,
                              std::span<std::uint32_t> out) const {
  const auto least = ByteReader(column).read<std::uint32_t>(0);
  if (!least) {
    std::ranges::fill(out, 1u);
    return;
  }
  NumberColumn(column.subspan(kBytesOfLeastWeight), size_, weights_).unpack(first, out);
  for (std::uint32_t& weight : out) {
    const std::uint64_t sum = std::uint64_t{*least} + weight;
    weight = static_cast<std::uint32_t>(
        std::clamp<std::uint64_t>(sum, 1, std::numeric_limits<std::uint32_t>::max()));
  }
}

void SampleRow::unpackOffsets(std::span<const std::byte> column, std::size_t first,
                              std::span<std::uint32_t> out) {
  const ByteReader reader(column);
  const auto start = reader.read<std::uint32_t>(0);
  const auto least = reader.read<std::uint32_t>(sizeof(std::uint32_t));
  if (!start || !least) {
    std::ranges::fill(out, 0u);
    return;
  }
  const NumberColumn differences(column.subspan(kBytesBeforeOffsets), size_ - 1, offsets_);
  if (nextOffset_ > first) nextOffset_ = 0;
  std::array<std::uint32_t, 256> passed;
  while (!out.empty()) {
    // Those before the first are passed over.
    const bool isWanted = nextOffset_ == first;
    const std::size_t count = isWanted ? out.size() : std::min(passed.size(), first - nextOffset_);
    const std::span<std::uint32_t> part =
        isWanted ? out : std::span<std::uint32_t>(passed).first(count);
    const bool isStart = nextOffset_ == 0;
    if (isStart) part[0] = lastOffset_ = *start;
    differences.unpack(isStart ? 0 : nextOffset_ - 1, part.subspan(isStart));
    for (std::uint32_t& offset : part.subspan(isStart)) offset = lastOffset_ += *least + offset;
    nextOffset_ += count;
    if (isWanted) return;
  }
}

}  // namespace tally
