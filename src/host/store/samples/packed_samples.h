// The packed form of samples as they arrive: one blob that describes itself.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>
#include <vector>

#include "host/store/sqlite_database.h"
#include "platform/recording/recording_store.h"

namespace tally {

constexpr std::size_t kMostPackedSamples = 4096;
// Of a blob: its header, and the longest, all columns of which have their widest form.
constexpr std::size_t kPackedHeader = 12;
constexpr std::size_t kLongestPacked = kPackedHeader + 8 + kMostPackedSamples * 16;

// The columns of a row that packedRowIsSound() looks at, and its blob, without loading one that is
// longer than any.
constexpr std::string_view kPackedSummary =
    "samples, weight, length(data), substr(data, 1, 12)";  // the header
constexpr std::string_view kBoundedBlob = "iif(length(data) <= 65556, data, NULL)";
static_assert(kPackedHeader == 12 && kLongestPacked == 65556);

// Samples that own their columns. No weights: each sample counts once.
struct SampleVectors {
  std::vector<double> values;
  std::vector<std::uint32_t> offsets, weights;

  std::size_t size() const { return values.size(); }
  void clear();
  void append(const SampleColumns& samples);
  SampleColumns columns() const { return {values, offsets, weights}; }
};

// The samples from first on, at most so many.
SampleColumns slice(const SampleColumns& samples, std::size_t first, std::size_t most);
std::uint64_t weightOf(const SampleColumns& samples);

// Every value comes back bit for bit. REQUIRES: 1 to 4096 samples.
std::vector<std::byte> packSamples(const SampleColumns& samples);

// What the first bytes of a blob say of it.
struct PackedLayout {
  std::uint16_t samples = 0;
  std::uint8_t valueForm = 0, scale = 0, offsetForm = 0, weightForm = 0;
  std::uint32_t firstOffset = 0;

  bool weighted() const { return weightForm != 0; }
};
// Empty unless the blob of that length, which starts so, holds samples: any that has a layout can
// be unpacked, whatever its other bytes are.
std::optional<PackedLayout> packedLayout(std::span<const std::byte> start, std::size_t length);

// Whether the blob of a row can be unpacked and the row counts its samples rightly. The row's
// columns are those of kPackedSummary, from the first on.
bool packedRowIsSound(const Statement& row, int first);

// Replaces what out holds. False if the blob holds no samples. Unpacks the values alone on request.
enum class PackedColumns { All, ValuesAndWeights };
bool unpackSamples(std::span<const std::byte> blob, PackedColumns columns, SampleVectors& out);

}  // namespace tally
