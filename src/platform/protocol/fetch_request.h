// The input of a storage driver's fetch calls: which data, and whether its size or the data itself.
#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>

#include "base/byte_reader.h"

namespace tally {

struct FetchRequest {
  static constexpr std::uint32_t kSizeQueryFlag = 1;

  std::uint32_t selector = 0;
  std::uint32_t flags = 0;
};

// Little-endian words: selector, flags, and 16 bytes of zeros.
using FetchRequestBytes = std::array<std::byte, 24>;

inline FetchRequestBytes encodeFetchRequest(const FetchRequest& request) {
  const std::array<std::uint32_t, 6> words{request.selector, request.flags};
  return std::bit_cast<FetchRequestBytes>(words);
}

// Empty unless it has the length of a request.
inline std::optional<FetchRequest> decodeFetchRequest(std::span<const std::byte> bytes) {
  if (bytes.size() != FetchRequestBytes().size()) return std::nullopt;
  const ByteReader words(bytes);
  return FetchRequest{*words.read<std::uint32_t>(0), *words.read<std::uint32_t>(4)};
}

}  // namespace tally
