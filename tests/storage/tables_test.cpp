// The key table and the key map as data: counts, spot values, and what holds for every row.
#include <gtest/gtest.h>

#include <algorithm>
#include <iterator>
#include <map>
#include <set>
#include <string>

#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"
#include "storage/statistics/key_map.h"
#include "storage/statistics/statistic_key_table.h"
#include "storage/statistics/statistic_keys.h"

namespace tally {
namespace {

std::uint16_t numberOfName(std::string_view name) {
  static const auto* numbers = [] {
    auto* made = new std::map<std::string_view, std::uint16_t>;
    for (std::uint16_t i = 0; i < kCounterNames; ++i) (*made)[SPXCounterName(i)] = i;
    return made;
  }();
  const auto found = numbers->find(name);
  return found == numbers->end() ? std::uint16_t{0xFFFF} : found->second;
}

TEST(KeyTable, CountsAndSpotValues) {
  std::set<std::uint16_t> keys;
  std::set<std::string_view> names;
  std::size_t arrays = 0, elements = 0;
  for (const StatisticKey& row : kStatisticKeys) {
    keys.insert(row.key);
    names.insert(row.name);
    arrays += row.maximum > 0;
    elements += row.maximum > 0 ? row.maximum : 1u;
  }
  EXPECT_EQ(std::size(kStatisticKeys), 406u);
  EXPECT_EQ(keys.size(), 406u);
  EXPECT_EQ(names.size(), 406u);
  EXPECT_EQ(arrays, 86u);
  EXPECT_EQ(elements, 1794u);

  const struct {
    std::uint32_t key;
    std::string_view name;  // empty: not known
    std::uint16_t maximum;  // 0: a scalar
  } spots[] = {
      {0, "", 0},
      {1, "version", 0},
      {14, "hostWriteLogHisto", 10},
      {21, "", 0},
      {53, "exportVersion", 0},
      {90, "qosPerCmdQ", 160},
      {184, "TempSensorMax", 1},
      {331, "bandsCrossTempHisto", 45},
      {460, "CacheDepthVsThroughput", 256},
      {531, "numDieFailures", 0},
      {532, "spareAvailablePercent", 0},
      {533, "", 0},
      {0x30000000, "", 0},
  };
  for (const auto& spot : spots) {
    SCOPED_TRACE(spot.key);
    Statistic found;
    ASSERT_EQ(findStatistic(spot.key, &found), !spot.name.empty());
    if (spot.name.empty()) continue;
    EXPECT_EQ(SPXCounterName(found.name), spot.name);
    EXPECT_EQ(found.isArray, spot.maximum != 0);
    EXPECT_EQ(found.maximum, std::max<std::uint16_t>(spot.maximum, 1));
  }
}

TEST(KeyTable, EveryNameIsItsBaseAndNumberAndEndsInAZeroByte) {
  for (const StatisticKey& row : kStatisticKeys) {
    Statistic statistic;
    ASSERT_TRUE(findStatistic(row.key, &statistic)) << row.name;
    const std::string_view plain = SPXCounterName(statistic.name);
    EXPECT_EQ(plain, row.name);
    EXPECT_EQ(plain.data()[plain.size()], '\0');
    for (unsigned i = 0; row.maximum > 1 && i < row.maximum; ++i) {
      const std::string_view element =
          SPXCounterName(static_cast<std::uint16_t>(statistic.name + 1 + i));
      EXPECT_EQ(element, row.name + std::to_string(i));
      EXPECT_EQ(element.data()[element.size()], '\0');
    }
  }
}

TEST(KeyMap, CountsAndSpotRows) {
  std::set<std::string_view> names, keys;
  for (const SPXKeyMapRow& row : keyMap) {
    if (row.name.empty()) break;
    names.insert(row.name);
    keys.insert(row.key);
    EXPECT_TRUE(row.key.starts_with("vellum.NANDInfo.")) << row.name;
  }
  EXPECT_EQ(keyMap.size(), 680u);
  EXPECT_TRUE(keyMap[679].name.empty());
  EXPECT_EQ(names.size(), 678u);  // numPfail twice
  EXPECT_EQ(keys.size(), 678u);

  const struct {
    std::uint16_t row;  // kNoRow: no such name
    std::string_view name, report;
  } spots[] = {
      {0, "staticSizeInMB", "StaticDataSizeInMB"},
      {6, "numBandsRefreshedForAgePerTier2", "NumRefreshesTier2"},
      {39, "bandsPerSpecialFlow2", "BandsPerInternalFlow2"},
      {kNoRow, "bandsPerSpecialFlow3", ""},
      {40, "bandsPerSpecialFlow4", "BandsPerInternalFlow3"},
      {62, "padSizes3", "PadSize4"},
      {19, "numMemExtreme", "numMemExtreme"},
      {20, "maxMemLowDuration", "maxMemExtremeDuration"},
      {21, "memLowDuration", "memExtremeDuration"},
      {kNoRow, "memExtremeDuration", ""},
      {677, "padSectorsPerFlow4", "padSectorsPerFlow4"},
      {678, "clogProgram", "clogProgram"},
      {kNoRow, "", ""},
      {kNoRow, "clogProgra", ""},
      {kNoRow, "clogProgram0", ""},
  };
  for (const auto& spot : spots) {
    SCOPED_TRACE(spot.name);
    EXPECT_EQ(keyMapRowOfName(numberOfName(spot.name)), spot.row);
    if (spot.row == kNoRow) continue;
    EXPECT_EQ(keyMap[spot.row].key, "vellum.NANDInfo." + std::string(spot.report));
  }
}

TEST(KeyMap, EveryRowIsFoundByTheNameOfACounter) {
  std::set<std::string_view> seen;
  for (std::size_t row = 0; row < kKeyMapRows; ++row) {
    const std::string_view name = keyMap[row].name;
    const std::uint16_t found = keyMapRowOfName(numberOfName(name));
    ASSERT_LT(found, kKeyMapRows) << name;
    EXPECT_EQ(keyMap[found].name, name);
    // The first row of a name holds.
    EXPECT_EQ(found == row, seen.insert(name).second) << name;
    EXPECT_EQ(keyMapKey(row)->view(), keyMap[row].key);
  }
}

}  // namespace
}  // namespace tally
