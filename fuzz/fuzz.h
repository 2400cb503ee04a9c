// What the fuzz targets share: their input, taken piece by piece, and checks that stop the process.
#pragma once

#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <span>
#include <string_view>
#include <vector>

// The entry point of a target: the fuzzer's name for it, or one of its own where fuzz_replay links
// all targets.
#ifdef FUZZ_REPLAY
#define FUZZ_TARGET(name) extern "C" int fuzz_##name
#else
#define FUZZ_TARGET(name) extern "C" int LLVMFuzzerTestOneInput
#endif

namespace tally::fuzz {

// Ends the process, so that the input is kept, unless the invariant holds. Written past stderr,
// which is silenced.
inline void require(bool holds, std::string_view invariant) {
  if (holds) return;
  constexpr std::string_view kBefore = "violated: ", kAfter = "\n";
  for (const std::string_view piece : {kBefore, invariant, kAfter}) {
    if (::write(STDERR_FILENO, piece.data(), piece.size()) < 0) break;
  }
  std::abort();
}

// The bytes of one run. Past their end there are zeros, so that a target need not check
// each piece for its presence.
class Input {
 public:
  Input(const std::uint8_t* data, std::size_t size) : left_(std::as_bytes(std::span(data, size))) {}

  bool empty() const { return left_.empty(); }
  template <class T>
  T take() {
    T value{};
    const auto bytes = takeBytes(sizeof value);
    if (!bytes.empty()) std::memcpy(&value, bytes.data(), bytes.size());
    return value;
  }
  bool takeFlag() { return take<std::uint8_t>() % 2 != 0; }
  // At most so many, in memory of their own, whose bounds are watched.
  std::vector<std::byte> takeCopy(std::size_t most) {
    const auto bytes = takeBytes(most);
    return {bytes.begin(), bytes.end()};
  }
  std::vector<std::byte> takeRest() { return takeCopy(left_.size()); }
  // At most so many; they live as long as the input.
  std::string_view takeText(std::size_t most) { return textOf(takeBytes(most)); }
  std::string_view rest() const { return textOf(left_); }

 private:
  static std::string_view textOf(std::span<const std::byte> bytes) {
    return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
  }
  std::span<const std::byte> takeBytes(std::size_t most) {
    const auto bytes = left_.first(std::min(most, left_.size()));
    left_ = left_.subspan(bytes.size());
    return bytes;
  }
  std::span<const std::byte> left_;
};

}  // namespace tally::fuzz
