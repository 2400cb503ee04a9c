// All names that a counter can have, numbered and laid out at compile time. A parse keeps a number
// for each counter, and what is known of a name is found by it.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "storage/statistics/counter_table.h"
#include "storage/statistics/decimal_names.h"

namespace tally {

constexpr std::uint16_t kHighestStatistic =
    std::ranges::max(kStorageCounters, {}, &StorageCounter::statistic).statistic;

// The first row of a statistic gives it its names. Further rows report other elements of it, and
// must repeat its name and number of elements.
constexpr std::size_t kNoStorageCounter = kStorageCounters.size();
using FirstRows = std::array<std::size_t, kHighestStatistic + 1>;  // kNoStorageCounter: not known
constexpr FirstRows findFirstRows() {
  FirstRows first;
  first.fill(kNoStorageCounter);
  for (std::size_t row = kStorageCounters.size(); row-- > 0;) {
    first[kStorageCounters[row].statistic] = row;
  }
  return first;
}
inline constexpr FirstRows kFirstRows = findFirstRows();

constexpr bool rowsOfEachStatisticAgree() {
  return std::ranges::all_of(kStorageCounters, [](const StorageCounter& row) {
    const StorageCounter& first = kStorageCounters[kFirstRows[row.statistic]];
    return &row == &first || (std::string_view(row.name) == first.name &&
                              row.elements == first.elements && row.isReported());
  });
}
static_assert(
    rowsOfEachStatisticAgree(),
    "two rows of a statistic differ in its name or number of elements, or report nothing");
static_assert(std::ranges::none_of(kStorageCounters,
                                   [](const StorageCounter& row) {
                                     return row.group == FigureGroup::Unassigned;
                                   }),
              "a storage counter has no group");
static_assert(std::ranges::all_of(kStorageCounters,
                                  [](const StorageCounter& row) {
                                    return row.elements > 0 &&
                                           row.firstElement() + row.reportCount() <= row.elements;
                                  }),
              "a storage counter reports elements that it does not have");

// A statistic's plain name has a number, and the names of its elements, if there are several, have
// the numbers after it.
constexpr std::size_t namesOf(const StorageCounter& row) {
  return row.elements > 1 ? 1u + row.elements : 1u;
}

// Writes the index-th of them; returns the end.
constexpr char* appendName(char* to, const StorageCounter& row, std::size_t index) {
  to = appendText(to, row.name);
  return index == 0 ? to : appendDecimal(to, static_cast<unsigned>(index - 1));
}
constexpr std::size_t nameLength(const StorageCounter& row, std::size_t index) {
  const std::size_t number = index == 0 ? 0 : decimalDigits(static_cast<unsigned>(index - 1));
  return std::string_view(row.name).size() + number;
}

struct NameTotals {
  std::size_t names = 0;
  std::size_t bytes = 0;  // each name ends in a zero byte
};
constexpr NameTotals countNames() {
  NameTotals totals;
  for (const std::size_t first : kFirstRows) {
    if (first == kNoStorageCounter) continue;
    const StorageCounter& row = kStorageCounters[first];
    totals.names += namesOf(row);
    for (std::size_t i = 0; i < namesOf(row); ++i) totals.bytes += nameLength(row, i) + 1;
  }
  return totals;
}
constexpr std::size_t kCounterNames = countNames().names;
constexpr std::size_t kCounterNameBytes = countNames().bytes;
static_assert(kCounterNames <= 0xFFFF && kCounterNameBytes <= 0xFFFF);

struct CounterNames {
  std::array<char, kCounterNameBytes> pool{};
  std::array<std::uint16_t, kCounterNames + 1> start{};  // of each name in the pool, and its end
  std::array<std::uint16_t, kHighestStatistic + 1> plainName{};  // number, by statistic

  constexpr std::string_view name(std::size_t number) const {
    return {&pool[start[number]], start[number + 1] - start[number] - 1u};
  }
  // Of an element of the row, which is the plain name where there is one value only.
  constexpr std::uint16_t numberOf(const StorageCounter& row, unsigned element) const {
    const unsigned offset = row.elements > 1 ? 1 + element : 0;
    return static_cast<std::uint16_t>(plainName[row.statistic] + offset);
  }
};

constexpr CounterNames makeCounterNames() {
  CounterNames names;
  char* const pool = names.pool.data();
  char* to = pool;
  std::size_t number = 0;
  for (const std::size_t first : kFirstRows) {
    if (first == kNoStorageCounter) continue;
    const StorageCounter& row = kStorageCounters[first];
    names.plainName[row.statistic] = static_cast<std::uint16_t>(number);
    for (std::size_t i = 0; i < namesOf(row); ++i) {
      names.start[number++] = static_cast<std::uint16_t>(to - pool);
      to = appendName(to, row, i) + 1;
    }
  }
  names.start[number] = static_cast<std::uint16_t>(to - pool);
  return names;
}

inline constexpr CounterNames kNames = makeCounterNames();

}  // namespace tally
