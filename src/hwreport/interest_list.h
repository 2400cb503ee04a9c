// The interest list: which channels of which drivers a subscription is for.
#pragma once

#include <cstddef>
#include <optional>
#include <vector>

#include "kv/value.h"

namespace tally {

// The hub's limit, which keeps the list's size within its 32 bits.
constexpr std::size_t kMaximumInterests = 0x555554D;

// The list as the hub takes it, in walk order. Empty when a channel has no driver id, channel id or
// type word, or when the channels are not exactly the count.
std::optional<std::vector<std::byte>> createInterestList(KvDictionary* desired, std::size_t count);

}  // namespace tally
