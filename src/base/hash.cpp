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

std::uint64_t mix(std::uint64_t state, std::uint64_t word) {
  __extension__ using Wide = unsigned __int128;
  const Wide product = static_cast<Wide>(state ^ word) * kMultiplier;
  return static_cast<std::uint64_t>(product) ^ static_cast<std::uint64_t>(product >> 64);
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
