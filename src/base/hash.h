// The hash of tables whose keys came from outside.
#pragma once

#include <cstdint>
#include <span>
#include <string_view>

namespace tally {

// Seeded once per process, so that a document made to collide costs no more than any other.
std::uint32_t hashBytes(std::string_view bytes) noexcept;
std::uint32_t hashWords(std::span<const std::uint64_t> words) noexcept;

}  // namespace tally
