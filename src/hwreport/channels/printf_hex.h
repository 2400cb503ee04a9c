// Hexadecimal numbers with their prefix as printf writes them: a zero has none.
#pragma once

#include <cstdint>
#include <string>

#include <fmt/core.h>

namespace tally {

// "%#llx", and with a width "%#0WIDTHllx".
inline std::string printfHex(std::uint64_t value, int width = 0) {
  return value == 0 ? fmt::format("{:0{}d}", 0, width > 1 ? width : 1)
                    : fmt::format("{:#0{}x}", value, width > 1 ? width : 1);
}

}  // namespace tally
