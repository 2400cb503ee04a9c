// The hash of tables whose keys came from outside.
#pragma once

#include <cstdint>
#include <string_view>

namespace tally {

// Seeded once per process, so that a document made to collide costs no more than any other.
std::uint32_t hashBytes(std::string_view bytes) noexcept;

}  // namespace tally
