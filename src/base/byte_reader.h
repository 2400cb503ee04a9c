// ByteReader: the only way in which untrusted buffers are read.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

namespace tally {

// Reads integers at any offset of a buffer, without alignment and never outside its bounds.
class ByteReader {
 public:
  explicit ByteReader(std::span<const std::byte> bytes) noexcept : bytes_(bytes) {}
  std::size_t size() const noexcept { return bytes_.size(); }
  bool has(std::size_t offset, std::size_t count) const noexcept {
    return offset <= bytes_.size() && count <= bytes_.size() - offset;
  }
  // Empty unless the whole range lies inside.
  std::optional<std::span<const std::byte>> slice(std::size_t offset, std::size_t count) const {
    if (!has(offset, count)) return std::nullopt;
    return bytes_.subspan(offset, count);
  }
  // An integer or floating-point number in the machine's byte order (little endian).
  template <class T>
  std::optional<T> read(std::size_t offset) const noexcept {
    static_assert(std::endian::native == std::endian::little);
    if (!has(offset, sizeof(T))) return std::nullopt;
    T value;
    std::memcpy(&value, bytes_.data() + offset, sizeof(T));
    return value;
  }
  // A big-endian unsigned integer of 1 to 8 bytes.
  std::optional<std::uint64_t> readBigEndian(std::size_t offset, std::size_t width) const noexcept {
    if (width == 0 || width > 8 || !has(offset, width)) return std::nullopt;
    std::uint64_t value = 0;
    for (std::size_t i = 0; i < width; ++i) {
      value = value << 8 | std::to_integer<std::uint64_t>(bytes_[offset + i]);
    }
    return value;
  }

 private:
  std::span<const std::byte> bytes_;
};

}  // namespace tally
