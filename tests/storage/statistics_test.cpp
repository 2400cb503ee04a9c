// The statistics parser, record by record, and the counter table and the key map as data.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <map>
#include <string>

#include "fakes/statistics_buffer.h"
#include "platform/protocol/storage_protocol.h"
#include "storage/nand_info.h"
#include "storage/statistics.h"
#include "storage/statistics/counter_names.h"
#include "storage/statistics/key_map.h"
#include "storage/statistics/statistic_keys.h"

namespace tally {
namespace {

using fakes::Bytes;
using fakes::Record;
using fakes::statisticsBuffer;
using testing::ElementsAre;
using testing::IsEmpty;
using Counters = std::vector<std::string>;

// "name=value"
Counters counters(const SPXParseContext& context) {
  Counters found;
  SPXForEachCounter(context, [&](std::string_view name, std::uint64_t value) {
    found.push_back(std::string(name) + "=" + std::to_string(value));
  });
  return found;
}

struct Parse {
  explicit Parse(const Bytes& bytes) { add(bytes); }
  ~Parse() { SPXReleaseContext(&context); }
  Parse(const Parse&) = delete;
  Parse& operator=(const Parse&) = delete;
  void add(const Bytes& bytes) {
    // Exactly as long as the data, so that a sanitizer sees a read beyond it.
    const Bytes exact = bytes;
    result = SPXParseBufferToCxt(&context, exact.data(), exact.size());
  }
  SPXParseContext context;
  int result = 0;
};

constexpr std::uint32_t kHighestKey = 0x30000000;
constexpr std::uint64_t kMax = 0xFFFFFFFFFFFFFFFF;

TEST(StatisticsParser, RecordsBecomeCounters) {
  const struct {
    const char* name;
    std::vector<Record> records;
    Counters counters;
    int result = 1;
  } cases[] = {
      {"values beyond a scalar's first",
       {{2, {5, 6, 7}}, {3, {8}}},
       {"hostWriteXacts=5", "hostReadXacts=8"}},
      {"scalar without a value", {{2, {}}, {3, {8}}}, {"hostReadXacts=8"}},
      {"array", {{91, {1, 2, 3}}}, {"maxQosPerCmdQ0=1", "maxQosPerCmdQ1=2", "maxQosPerCmdQ2=3"}},
      {"array that takes one",
       {{184, {4, 5, 6}}, {185, {7}}},
       {"TempSensorMax=4", "TempSensorMin=7"}},
      {"elements beyond the maximum",
       {{93, {1, 2, 3, 4, 5}}, {2, {6}}},
       {"numBandsRefreshedForAgePerTier0=1", "numBandsRefreshedForAgePerTier1=2",
        "numBandsRefreshedForAgePerTier2=3", "hostWriteXacts=6"}},
      {"highest key", {{kHighestKey, {1}}, {2, {1}}}, {"hostWriteXacts=1"}},
      {"key above it", {{2, {1}}, {kHighestKey + 1, {1}}, {3, {1}}}, {"hostWriteXacts=1"}, 0},
      {"one value too many announced", {{2, {1}}, {3, {1}, 2}}, {"hostWriteXacts=1"}, 0},
      {"count far beyond the buffer", {{2, {1}, 0xFFFFFFFF}}, {}, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::vector<Record> records = c.records;
    records.insert(records.begin(), {53, {0x20002}});
    Parse parse(statisticsBuffer(records));
    EXPECT_EQ(parse.result, c.result);
    Counters expected = c.counters;
    expected.insert(expected.begin(), "exportVersion=131074");
    EXPECT_EQ(counters(parse.context), expected);
    EXPECT_EQ(parse.context.exportVersion, c.result == 1 ? 0x20002u : 0u);
    EXPECT_EQ(parse.context.driverVersion, 0xFFFFFFFFu);
  }
}

TEST(StatisticsParser, ASecondBufferAppends) {
  Parse parse(statisticsBuffer({{2, {1}}, {265, {1, 2, 3, 4, 5}}}));
  parse.add(statisticsBuffer({{3, {2}}, {265, {9}}}));
  EXPECT_THAT(
      counters(parse.context),
      ElementsAre("hostWriteXacts=1", "readCountHisto0=1", "readCountHisto1=2", "readCountHisto2=3",
                  "readCountHisto3=4", "readCountHisto4=5", "hostReadXacts=2", "readCountHisto=9"));
  EXPECT_THAT(parse.context.readCountHisto, ElementsAre(9, 2, 3, 4, 5));

  parse.add(statisticsBuffer({{53, {1}}, {7, {5}}}));
  SPXReleaseContext(&parse.context);
  EXPECT_EQ(parse.context.exportVersion, 0u);
  EXPECT_EQ(parse.context.hostReads, 0u);
  EXPECT_EQ(parse.context.firstBlock, nullptr);
}

// Every name that a counter can have, and its number.
std::map<std::string_view, std::uint16_t> numbersOfNames() {
  std::map<std::string_view, std::uint16_t> numbers;
  for (std::uint16_t i = 0; i < kCounterNames; ++i) numbers[SPXCounterName(i)] = i;
  return numbers;
}

TEST(CounterTable, EveryNameIsItsBaseAndNumberAndEndsInAZeroByte) {
  EXPECT_EQ(numbersOfNames().size(), kCounterNames) << "two counters have the same name";
  for (const StorageCounter& row : kStorageCounters) {
    const Statistic* const statistic = findStatistic(row.statistic);
    ASSERT_NE(statistic, nullptr) << row.name;
    EXPECT_EQ(statistic->elements, row.elements) << row.name;
    const std::string_view plain = SPXCounterName(statistic->name);
    EXPECT_EQ(plain, row.name);
    EXPECT_EQ(plain.data()[plain.size()], '\0');
    for (unsigned i = 0; row.elements > 1 && i < row.elements; ++i) {
      const std::string_view element =
          SPXCounterName(static_cast<std::uint16_t>(statistic->name + 1 + i));
      EXPECT_EQ(element, row.name + std::to_string(i));
      EXPECT_EQ(element.data()[element.size()], '\0');
    }
  }
}

TEST(KeyMap, EveryRowIsFoundByTheNameOfACounter) {
  const auto numbers = numbersOfNames();
  std::map<std::string_view, std::string_view> names;  // by key
  for (std::size_t row = 0; row < keyMap.size(); ++row) {
    const auto& [name, key] = keyMap[row];
    ASSERT_TRUE(numbers.contains(name)) << name;
    // The first row of a name applies.
    const bool isFirst = names.emplace(key, name).second;
    EXPECT_EQ(names[key], name) << "both are reported as " << key;
    EXPECT_EQ(keyMapRowOfName(numbers.at(name)) == row, isFirst) << name;
    EXPECT_EQ(keyMapKey(row)->view(), key);
  }
  EXPECT_TRUE(keyMap.data()[keyMap.size()].name.empty()) << "the end row";
}

TEST(CounterTable, TheKernelsDisksExportStatisticsOfTheseKeys) {
  for (const ExportedStatistic& exported : kExportedStatistics) {
    SCOPED_TRACE(exported.key);
    Parse parse(statisticsBuffer(
        {{kExportVersionStatistic, {kFullExportVersion}}, {exported.statistic, {4711}}}));
    EXPECT_EQ(buildNandInfo(parse.context, true)->getInt64(exported.key), 4711);
  }
}

}  // namespace
}  // namespace tally
