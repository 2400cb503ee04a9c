// Finds the row of keyMap for a counter.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kv/value.h"
#include "storage/statistics/name_index.h"

namespace tally {

// The first row of keyMap whose name is that of the number, or kNoRow.
std::uint16_t keyMapRowOfName(std::uint16_t number) noexcept;

// The row's report key, made once and shared by all dictionaries.
const KvRef<KvString>& keyMapKey(std::size_t row);

}  // namespace tally
