// All names that a counter can have, numbered and laid out at compile time: a parse keeps a number
// for each counter, and what is known of a name is found by it.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <string_view>

#include "storage/statistics/decimal_names.h"
#include "storage/statistics/statistic_key_table.h"

namespace tally {

// A statistic's plain name has a number, and its elements' names (when it has several) the numbers
// after it.
constexpr std::size_t namesOf(const StatisticKey& row) {
  return row.maximum > 1 ? 1u + row.maximum : 1u;
}

// The text of the name-th of them, written at `to`; returns the place behind.
constexpr char* appendName(char* to, const StatisticKey& row, std::size_t name) {
  to = appendText(to, row.name);
  return name == 0 ? to : appendDecimal(to, static_cast<unsigned>(name - 1));
}
constexpr std::size_t nameLength(const StatisticKey& row, std::size_t name) {
  const std::size_t number = name == 0 ? 0 : decimalDigits(static_cast<unsigned>(name - 1));
  return std::string_view(row.name).size() + number;
}

constexpr std::size_t kStatistics = std::size(kStatisticKeys);

constexpr std::size_t countNames() {
  std::size_t count = 0;
  for (const StatisticKey& row : kStatisticKeys) count += namesOf(row);
  return count;
}
constexpr std::size_t kCounterNames = countNames();
static_assert(kCounterNames <= 0xFFFF);

constexpr std::size_t countNameBytes() {
  std::size_t bytes = 0;
  for (const StatisticKey& row : kStatisticKeys) {
    for (std::size_t name = 0; name < namesOf(row); ++name) bytes += nameLength(row, name) + 1;
  }
  return bytes;
}
constexpr std::size_t kCounterNameBytes = countNameBytes();
static_assert(kCounterNameBytes <= 0xFFFF);

struct CounterNames {
  std::array<char, kCounterNameBytes> pool{};            // each ends in a zero byte
  std::array<std::uint16_t, kCounterNames + 1> start{};  // of each name in the pool, and its end
  std::array<std::uint16_t, kStatistics> plainName{};    // number of each statistic's plain name

  constexpr std::string_view name(std::size_t number) const {
    return {&pool[start[number]], start[number + 1] - start[number] - 1u};
  }
};

constexpr CounterNames makeCounterNames() {
  CounterNames names;
  char* const pool = names.pool.data();
  char* to = pool;
  std::size_t number = 0;
  for (std::size_t statistic = 0; statistic < kStatistics; ++statistic) {
    const StatisticKey& row = kStatisticKeys[statistic];
    names.plainName[statistic] = static_cast<std::uint16_t>(number);
    for (std::size_t name = 0; name < namesOf(row); ++name) {
      names.start[number++] = static_cast<std::uint16_t>(to - pool);
      to = appendName(to, row, name) + 1;
    }
  }
  names.start[number] = static_cast<std::uint16_t>(to - pool);
  return names;
}

inline constexpr CounterNames kNames = makeCounterNames();

}  // namespace tally
