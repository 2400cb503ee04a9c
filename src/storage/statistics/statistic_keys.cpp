#include "storage/statistics/statistic_keys.h"

#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"

namespace tally {
namespace {

using KeyIndex = std::array<Statistic, kHighestStatistic + 1>;  // no elements: not known

constexpr KeyIndex makeKeyIndex() {
  KeyIndex index{};
  for (const StorageCounter& row : kStorageCounters) {
    index[row.statistic] = {row.elements, kNames.plainName[row.statistic]};
  }
  return index;
}

constexpr KeyIndex kIndex = makeKeyIndex();

}  // namespace

const Statistic* findStatistic(std::uint32_t key) noexcept {
  return key < kIndex.size() && kIndex[key].elements != 0 ? &kIndex[key] : nullptr;
}

std::string_view SPXCounterName(std::uint16_t number) noexcept {
  return number < kCounterNames ? kNames.name(number) : std::string_view("");
}

}  // namespace tally
