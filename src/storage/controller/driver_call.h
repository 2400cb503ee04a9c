// A structure in, a structure out: the one shape of the storage driver's methods.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>

namespace tally {

struct StructReply {
  std::uint32_t status = 0;  // 0: success
  std::size_t length = 0;    // bytes written, at most the room that was offered
};

StructReply callStructMethod(std::uint32_t connection, std::uint32_t method,
                             std::span<const std::byte> input, std::span<std::byte> output);

}  // namespace tally
