// Finds the row of keyMap for a counter, and what is known of the row.
#pragma once

#include <cstddef>
#include <cstdint>

#include "kv/value.h"
#include "storage/statistics/figure_group.h"

namespace tally {

constexpr std::uint16_t kNoRow = 0xFFFF;

// The first row of keyMap for the counter name of that number, or kNoRow.
std::uint16_t keyMapRowOfName(std::uint16_t number) noexcept;

// The row's report key, made once and shared by all dictionaries.
const KvRef<KvString>& keyMapKey(std::size_t row);

FigureGroup keyMapGroup(std::size_t row) noexcept;

}  // namespace tally
