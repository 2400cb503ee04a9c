#include "host/store/samples/sample_chunk.h"

#include <bit>
#include <cstring>

#include "base/byte_reader.h"

namespace tally {
namespace {

static_assert(std::endian::native == std::endian::little, "columns are little endian");

constexpr std::int64_t kMostSamples = 1 << 20;

template <class T>
void unpack(std::span<const std::byte> column, std::size_t first, std::span<T> out) {
  const auto bytes = ByteReader(column).slice(first * sizeof(T), out.size_bytes());
  if (bytes && !bytes->empty()) std::memcpy(out.data(), bytes->data(), bytes->size());
}

}  // namespace

bool chunkIsSound(std::int64_t samples, std::int64_t valueBytes, std::int64_t offsetBytes) {
  return samples > 0 && samples <= kMostSamples &&
         valueBytes == samples * std::int64_t{sizeof(double)} &&
         offsetBytes == samples * std::int64_t{sizeof(std::uint32_t)};
}

void unpackValues(std::span<const std::byte> column, std::size_t first, std::span<double> out) {
  unpack(column, first, out);
}

void unpackOffsets(std::span<const std::byte> column, std::size_t first,
                   std::span<std::uint32_t> out) {
  unpack(column, first, out);
}

std::span<const std::byte> packValues(std::span<const double> values) {
  return std::as_bytes(values);
}

std::span<const std::byte> packOffsets(std::span<const std::uint32_t> offsets) {
  return std::as_bytes(offsets);
}

}  // namespace tally
