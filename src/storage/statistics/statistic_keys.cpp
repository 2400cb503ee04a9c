#include "storage/statistics/statistic_keys.h"

#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"

namespace tally {
namespace {

constexpr std::uint16_t kHighestKey =
    std::max_element(std::begin(kStatisticKeys), std::end(kStatisticKeys),
                     [](const StatisticKey& a, const StatisticKey& b) { return a.key < b.key; })
        ->key;

using KeyIndex = std::array<Statistic, kHighestKey + 1>;  // maximum 0: not known

constexpr KeyIndex makeKeyIndex() {
  KeyIndex index{};
  for (std::size_t row = 0; row < kStatistics; ++row) {
    const StatisticKey& key = kStatisticKeys[row];
    index[key.key] = {key.maximum != 0, std::max<std::uint16_t>(key.maximum, 1),
                      kNames.plainName[row]};
  }
  return index;
}

constexpr KeyIndex kIndex = makeKeyIndex();

}  // namespace

bool findStatistic(std::uint32_t key, Statistic* statistic) noexcept {
  if (key >= kIndex.size() || kIndex[key].maximum == 0) return false;
  *statistic = kIndex[key];
  return true;
}

std::string_view SPXCounterName(std::uint16_t number) noexcept {
  return number < kCounterNames ? kNames.name(number) : std::string_view("");
}

}  // namespace tally
