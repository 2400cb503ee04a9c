#include "host/store/samples/packed_samples.h"

#include <algorithm>
#include <array>
#include <bit>
#include <cstring>
#include <limits>
#include <numeric>

#include "base/byte_reader.h"
#include "host/store/samples/decimals.h"

namespace tally {
namespace {

// A blob: the header, then the columns of values, offsets and weights without gaps, little endian.
// The header: the version, the form of the values, their decimal scale, the forms of the offsets
// and of the weights, 0, the number of samples (16 bits) and the first offset (32 bits).
constexpr std::uint8_t kVersion = 1;
// Constant: the value. Decimals: the least one's digits (64 bits), then by how much each exceeds
// them; the digits are divided by 10^scale. Every form below Double is used where it is exact.
enum ValueForm : std::uint8_t { kConstant, kDecimal8, kDecimal16, kDecimal32, kFloat, kDouble };
// Differences from the sample before, modulo 2^32: clocks may step back.
enum OffsetForm : std::uint8_t { kNoDifference, kDifference8, kDifference16, kDifference32 };
// Less 1, so that no blob can say 0.
enum WeightForm : std::uint8_t { kOne, kSameWeight, kWeight8, kWeight16, kWeight32 };

constexpr std::size_t kBytesOfValue[] = {0, 1, 2, 4, sizeof(float), sizeof(double)};
constexpr std::size_t kBytesBeforeValues[] = {sizeof(double), 8, 8, 8, 0, 0};
constexpr std::size_t kBytesOfDifference[] = {0, 1, 2, 4};
constexpr std::size_t kBytesOfWeight[] = {0, 0, 1, 2, 4};
constexpr std::size_t kBytesBeforeWeights[] = {0, 4, 0, 0, 0};

// How many bytes the number takes: 1, 2, 4 or, for more than 32 bits, 8.
std::size_t widthOf(std::uint64_t number) {
  return number <= 0xff ? 1 : number <= 0xffff ? 2 : number <= 0xffffffff ? 4 : 8;
}

template <class T>
void put(std::vector<std::byte>& blob, T number) {
  const auto bytes = std::bit_cast<std::array<std::byte, sizeof(T)>>(number);
  blob.insert(blob.end(), bytes.begin(), bytes.end());
}

// The low bytes of each number.
void putColumn(std::vector<std::byte>& blob, std::size_t width,
               std::span<const std::uint64_t> numbers) {
  for (const std::uint64_t number : numbers) {
    for (std::size_t i = 0; i < width; ++i) {
      blob.push_back(static_cast<std::byte>(number >> (8 * i)));
    }
  }
}

template <class T, class Handler>
void eachNumber(std::span<const std::byte> column, const Handler& handler) {
  for (std::size_t i = 0; i < column.size() / sizeof(T); ++i) {
    T number;
    std::memcpy(&number, column.data() + i * sizeof(T), sizeof(T));
    handler(i, number);
  }
}

void putValues(std::vector<std::byte>& blob, std::span<const double> values) {
  const auto setForm = [&](ValueForm form, std::size_t scale) {
    blob[1] = std::byte{form};
    blob[2] = static_cast<std::byte>(scale);
  };
  if (areEqual(values)) {
    setForm(kConstant, 0);
    return put(blob, values[0]);
  }
  const auto decimals = decimalsOf(values);
  if (const std::size_t width = decimals ? widthOf(decimals->most) : 8; width <= 4) {
    setForm(width == 1 ? kDecimal8 : width == 2 ? kDecimal16 : kDecimal32, decimals->scale);
    put(blob, decimals->least);
    return putColumn(blob, width, decimals->excess);
  }
  if (fitFloats(values)) {
    setForm(kFloat, 0);
    for (const double value : values) put(blob, static_cast<float>(value));
    return;
  }
  setForm(kDouble, 0);
  const auto bytes = std::as_bytes(values);
  blob.insert(blob.end(), bytes.begin(), bytes.end());
}

void putOffsets(std::vector<std::byte>& blob, std::span<const std::uint32_t> offsets) {
  std::vector<std::uint64_t> differences;
  std::uint32_t most = 0;  // of the differences' absolute values, less one where they are negative
  for (std::size_t i = 1; i < offsets.size(); ++i) {
    const std::uint32_t difference = offsets[i] - offsets[i - 1];
    differences.push_back(difference);
    most = std::max(most, difference >> 31 != 0 ? ~difference : difference);
  }
  if (std::ranges::all_of(differences, [](std::uint64_t number) { return number == 0; })) {
    return;
  }
  const OffsetForm form = most <= INT8_MAX    ? kDifference8
                          : most <= INT16_MAX ? kDifference16
                                              : kDifference32;
  blob[3] = std::byte{form};
  putColumn(blob, kBytesOfDifference[form], differences);
}

void putWeights(std::vector<std::byte>& blob, std::span<const std::uint32_t> weights) {
  if (std::ranges::all_of(weights, [](std::uint32_t weight) { return weight == 1; })) return;
  std::vector<std::uint64_t> excess;
  std::uint64_t most = 0;
  for (const std::uint32_t weight : weights) {
    excess.push_back(weight - 1);
    most = std::max(most, excess.back());
  }
  if (std::ranges::all_of(excess, [&](std::uint64_t number) { return number == most; })) {
    blob[4] = std::byte{kSameWeight};
    return put(blob, static_cast<std::uint32_t>(most));
  }
  const std::size_t width = widthOf(most);
  blob[4] = std::byte{width == 1 ? kWeight8 : width == 2 ? kWeight16 : kWeight32};
  putColumn(blob, width, excess);
}

std::size_t bytesOfValues(const PackedLayout& layout) {
  return kBytesBeforeValues[layout.valueForm] + layout.samples * kBytesOfValue[layout.valueForm];
}
std::size_t bytesOfOffsets(const PackedLayout& layout) {
  return (layout.samples - std::size_t{1}) * kBytesOfDifference[layout.offsetForm];
}
std::size_t bytesOfWeights(const PackedLayout& layout) {
  return kBytesBeforeWeights[layout.weightForm] +
         layout.samples * kBytesOfWeight[layout.weightForm];
}

template <class T>
void takeDecimals(const PackedLayout& layout, std::span<const std::byte> column,
                  std::vector<double>& values) {
  const std::uint64_t least = ByteReader(column).read<std::uint64_t>(0).value_or(0);
  const double divisor = kPowersOfTen[layout.scale];
  eachNumber<T>(column.subspan(sizeof least), [&](std::size_t i, T excess) {
    values[i] = static_cast<double>(static_cast<std::int64_t>(least + excess)) / divisor;
  });
}

void takeValues(const PackedLayout& layout, std::span<const std::byte> column,
                std::vector<double>& values) {
  switch (layout.valueForm) {
    case kConstant:
      std::ranges::fill(values, ByteReader(column).read<double>(0).value_or(0));
      return;
    case kDecimal8:
      return takeDecimals<std::uint8_t>(layout, column, values);
    case kDecimal16:
      return takeDecimals<std::uint16_t>(layout, column, values);
    case kDecimal32:
      return takeDecimals<std::uint32_t>(layout, column, values);
    case kFloat:
      return eachNumber<float>(column, [&](std::size_t i, float value) { values[i] = value; });
    default:
      std::memcpy(values.data(), column.data(), column.size());
  }
}

void takeOffsets(const PackedLayout& layout, std::span<const std::byte> column,
                 std::vector<std::uint32_t>& offsets) {
  std::ranges::fill(offsets, layout.firstOffset);
  const auto add = [&](std::size_t i, auto difference) {
    offsets[i + 1] = offsets[i] + static_cast<std::uint32_t>(difference);
  };
  if (layout.offsetForm == kDifference8) eachNumber<std::int8_t>(column, add);
  if (layout.offsetForm == kDifference16) eachNumber<std::int16_t>(column, add);
  if (layout.offsetForm == kDifference32) eachNumber<std::int32_t>(column, add);
}

void takeWeights(const PackedLayout& layout, std::span<const std::byte> column,
                 std::vector<std::uint32_t>& weights) {
  constexpr std::uint32_t kMost = std::numeric_limits<std::uint32_t>::max();
  const auto take = [&](std::size_t i, std::uint32_t excess) {
    weights[i] = excess == kMost ? kMost : excess + 1;
  };
  if (layout.weightForm == kSameWeight) {
    take(0, ByteReader(column).read<std::uint32_t>(0).value_or(0));
    std::ranges::fill(weights, weights[0]);
  }
  if (layout.weightForm == kWeight8) eachNumber<std::uint8_t>(column, take);
  if (layout.weightForm == kWeight16) eachNumber<std::uint16_t>(column, take);
  if (layout.weightForm == kWeight32) eachNumber<std::uint32_t>(column, take);
}

}  // namespace

void SampleVectors::clear() {
  values.clear();
  offsets.clear();
  weights.clear();
}

void SampleVectors::append(const SampleColumns& samples) {
  if (!samples.weights.empty()) {
    weights.resize(values.size(), 1);
    weights.insert(weights.end(), samples.weights.begin(), samples.weights.end());
  }
  values.insert(values.end(), samples.values.begin(), samples.values.end());
  offsets.insert(offsets.end(), samples.offsets.begin(), samples.offsets.end());
  if (!weights.empty()) weights.resize(values.size(), 1);
}

SampleColumns slice(const SampleColumns& samples, std::size_t first, std::size_t most) {
  const auto part = [&](auto column) {
    const auto rest = column.subspan(std::min(first, column.size()));
    return rest.first(std::min(most, rest.size()));
  };
  return {part(samples.values), part(samples.offsets), part(samples.weights)};
}

std::uint64_t weightOf(const SampleColumns& samples) {
  if (samples.weights.empty()) return samples.values.size();
  return std::accumulate(samples.weights.begin(), samples.weights.end(), std::uint64_t{0});
}

std::vector<std::byte> packSamples(const SampleColumns& samples) {
  std::vector<std::byte> blob(kPackedHeader - sizeof(std::uint16_t) - sizeof(std::uint32_t));
  blob[0] = std::byte{kVersion};
  put(blob, static_cast<std::uint16_t>(samples.values.size()));
  put(blob, samples.offsets[0]);
  putValues(blob, samples.values);
  putOffsets(blob, samples.offsets);
  putWeights(blob, samples.weights);
  return blob;
}

std::optional<PackedLayout> packedLayout(std::span<const std::byte> start, std::size_t length) {
  const ByteReader reader(start);
  if (!reader.has(0, kPackedHeader) || *reader.read<std::uint8_t>(0) != kVersion) return {};
  PackedLayout layout;
  layout.valueForm = *reader.read<std::uint8_t>(1);
  layout.scale = *reader.read<std::uint8_t>(2);
  layout.offsetForm = *reader.read<std::uint8_t>(3);
  layout.weightForm = *reader.read<std::uint8_t>(4);
  layout.samples = *reader.read<std::uint16_t>(6);
  layout.firstOffset = *reader.read<std::uint32_t>(8);
  const bool known = layout.valueForm <= kDouble && layout.scale < std::size(kPowersOfTen) &&
                     layout.offsetForm <= kDifference32 && layout.weightForm <= kWeight32 &&
                     *reader.read<std::uint8_t>(5) == 0;
  if (!known || layout.samples == 0 || layout.samples > kMostPackedSamples) return {};
  const std::size_t expected =
      kPackedHeader + bytesOfValues(layout) + bytesOfOffsets(layout) + bytesOfWeights(layout);
  return length == expected ? std::optional(layout) : std::nullopt;
}

bool packedRowIsSound(const Statement& row, int first) {
  const std::int64_t length = row.integer(first + 2);
  if (length < 0 || length > static_cast<std::int64_t>(kLongestPacked)) return false;
  const auto layout = packedLayout(row.blob(first + 3), static_cast<std::size_t>(length));
  if (!layout || row.integer(first) != layout->samples) return false;
  return layout->weighted() == (row.integer(first + 1) != layout->samples);
}

bool unpackSamples(std::span<const std::byte> blob, PackedColumns columns, SampleVectors& out) {
  out.clear();
  const auto layout = packedLayout(blob, blob.size());
  if (!layout) return false;
  const std::size_t values = bytesOfValues(*layout), offsets = bytesOfOffsets(*layout);
  out.values.resize(layout->samples);
  takeValues(*layout, blob.subspan(kPackedHeader, values), out.values);
  if (columns == PackedColumns::All) {
    out.offsets.resize(layout->samples);
    takeOffsets(*layout, blob.subspan(kPackedHeader + values, offsets), out.offsets);
  }
  if (layout->weighted()) {
    out.weights.resize(layout->samples);
    takeWeights(*layout, blob.subspan(kPackedHeader + values + offsets), out.weights);
  }
  return true;
}

}  // namespace tally
