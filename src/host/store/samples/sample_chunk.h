// How the metrics store packs samples: a chunk has the values of successive samples in one column,
// 64-bit floating point, and their seconds into the day in another, unsigned 32-bit; both little
// endian and without gaps. A pass that needs the values alone never touches the other column.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace tally {

// Samples of a full chunk: columns of 32 and 16 KiB, which the second-level cache holds.
constexpr std::size_t kChunkSamples = 4096;

// Whether the columns of a chunk have the lengths that its count of samples says, and a count that
// memory can hold whoever wrote it.
bool chunkIsSound(std::int64_t samples, std::int64_t valueBytes, std::int64_t offsetBytes);

// Unpacks the samples from first on, as many as out holds. REQUIRES: the column has that many.
void unpackValues(std::span<const std::byte> column, std::size_t first, std::span<double> out);
void unpackOffsets(std::span<const std::byte> column, std::size_t first,
                   std::span<std::uint32_t> out);

// The columns of samples; views of the same memory.
std::span<const std::byte> packValues(std::span<const double> values);
std::span<const std::byte> packOffsets(std::span<const std::uint32_t> offsets);

}  // namespace tally
