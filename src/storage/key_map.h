// Finds the row of keyMap for a counter.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

#include "kv/value.h"

namespace tally {

// The first row of that name, or kNoRow; in constant time. hash is the name's nameHash.
std::size_t keyMapRowOfName(std::string_view name, std::uint32_t hash) noexcept;

// The row's report key, made once and shared by all dictionaries.
const KvRef<KvString>& keyMapKey(std::size_t row);

}  // namespace tally
