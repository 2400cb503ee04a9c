// All names that a counter can have are laid out at compile time: a parse only points at them.
#include "storage/statistic_keys.h"

#include <algorithm>
#include <array>
#include <iterator>

#include "storage/decimal_names.h"
#include "storage/statistic_key_table.h"

namespace tally {
namespace {

constexpr std::size_t kStatistics = std::size(kStatisticKeys);
constexpr std::uint16_t kHighestKey =
    std::max_element(std::begin(kStatisticKeys), std::end(kStatisticKeys),
                     [](const StatisticKey& a, const StatisticKey& b) { return a.key < b.key; })
        ->key;

constexpr std::size_t strideOf(const StatisticKey& row) {
  if (row.maximum < 2) return 0;
  return std::string_view(row.name).size() + decimalDigits(row.maximum - 1u) + 1;
}

constexpr std::size_t poolSize() {
  std::size_t size = 0;
  for (const StatisticKey& row : kStatisticKeys) {
    size += std::string_view(row.name).size() + 1 + row.maximum * strideOf(row);
  }
  return size;
}

struct Names {
  std::array<char, poolSize()> pool{};
  std::array<Statistic, kStatistics> statistics{};
  std::array<std::uint16_t, kHighestKey + 1> rowOfKey{};  // row + 1, 0 for none
};

constexpr Names makeNames() {
  Names names;
  std::size_t at = 0;
  for (std::size_t row = 0; row < kStatistics; ++row) {
    const StatisticKey& key = kStatisticKeys[row];
    Statistic& statistic = names.statistics[row];
    statistic.isArray = key.maximum != 0;
    statistic.maximum = statistic.isArray ? key.maximum : 1;
    statistic.nameLength = static_cast<std::uint16_t>(std::string_view(key.name).size());
    statistic.elementStride = static_cast<std::uint16_t>(strideOf(key));
    statistic.name = static_cast<std::uint32_t>(at);
    appendText(&names.pool[at], key.name);
    at += statistic.nameLength + 1u;
    for (unsigned element = 0; statistic.elementStride != 0 && element < key.maximum; ++element) {
      appendDecimal(appendText(&names.pool[at], key.name), element);
      at += statistic.elementStride;
    }
    names.rowOfKey[key.key] = static_cast<std::uint16_t>(row + 1);
  }
  return names;
}

constexpr Names kNames = makeNames();

}  // namespace

const Statistic* findStatistic(std::uint32_t key) noexcept {
  const std::size_t row = key < kNames.rowOfKey.size() ? kNames.rowOfKey[key] : 0;
  return row == 0 ? nullptr : &kNames.statistics[row - 1];
}

std::string_view statisticName(const Statistic& statistic) noexcept {
  return {&kNames.pool[statistic.name], statistic.nameLength};
}

std::string_view statisticElementName(const Statistic& statistic, std::size_t index) noexcept {
  const std::size_t at =
      statistic.name + statistic.nameLength + 1 + index * statistic.elementStride;
  return {&kNames.pool[at], statistic.nameLength + decimalDigits(static_cast<unsigned>(index))};
}

}  // namespace tally
