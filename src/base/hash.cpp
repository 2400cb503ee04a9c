#include "base/hash.h"

#include <cstring>
#include <random>

namespace tally {
namespace {

constexpr std::uint64_t kMultiplier = 0x9E3779B97F4A7C15;

std::uint64_t processSeed() {
  std::random_device random;
  return (std::uint64_t{random()} << 32) | random();
}

// Both halves of the 128-bit product, combined by exclusive or, from products of 32-bit parts.
constexpr std::uint64_t foldedProductOfParts(std::uint64_t a, std::uint64_t b) {
  constexpr std::uint64_t kLow = 0xFFFFFFFF;
  const std::uint64_t low = (a & kLow) * (b & kLow), high = (a >> 32) * (b >> 32);
  const std::uint64_t cross = (a >> 32) * (b & kLow), otherCross = (a & kLow) * (b >> 32);
  const std::uint64_t carried = (low >> 32) + (cross & kLow) + (otherCross & kLow);
  return (a * b) ^ (high + (cross >> 32) + (otherCross >> 32) + (carried >> 32));
}

#ifdef __SIZEOF_INT128__
constexpr std::uint64_t foldedProduct(std::uint64_t a, std::uint64_t b) {
  __extension__ using Wide = unsigned __int128;
  const Wide product = static_cast<Wide>(a) * b;
  return static_cast<std::uint64_t>(product) ^ static_cast<std::uint64_t>(product >> 64);
}
// 32-bit processors have no such type, and must find the same.
static_assert(foldedProduct(UINT64_MAX, UINT64_MAX) ==
              foldedProductOfParts(UINT64_MAX, UINT64_MAX));
static_assert(foldedProduct(0x8000'0001'FFFF'FFFF, kMultiplier) ==
              foldedProductOfParts(0x8000'0001'FFFF'FFFF, kMultiplier));
#else
constexpr auto foldedProduct = foldedProductOfParts;
#endif

std::uint64_t mix(std::uint64_t state, std::uint64_t word) {
  return foldedProduct(state ^ word, kMultiplier);
}

std::uint64_t hashSeed() {
  static const std::uint64_t seed = processSeed();
  return seed;
}

std::uint32_t finish(std::uint64_t state, std::uint64_t seed) {
  state = mix(state, seed);
  return static_cast<std::uint32_t>(state ^ (state >> 32));
}

}  // namespace

std::uint32_t hashBytes(std::string_view bytes) noexcept {
  const std::uint64_t seed = hashSeed();
  std::uint64_t state = seed ^ bytes.size();
  while (bytes.size() >= 8) {
    std::uint64_t word;
    std::memcpy(&word, bytes.data(), 8);
    state = mix(state, word);
    bytes.remove_prefix(8);
  }
  std::uint64_t rest = 0;
  if (!bytes.empty()) std::memcpy(&rest, bytes.data(), bytes.size());
  return finish(mix(state, rest), seed);
}

std::uint32_t hashWords(std::span<const std::uint64_t> words) noexcept {
  const std::uint64_t seed = hashSeed();
  std::uint64_t state = seed;
  for (const std::uint64_t word : words) state = mix(state, word);
  return finish(state, seed);
}

}  // namespace tally
