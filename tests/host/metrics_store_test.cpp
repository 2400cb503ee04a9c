// The metrics store on disk: what comes back, in which order, and which days stay.
#include <algorithm>
#include <cmath>
#include <cstring>

#include "host/store/samples/sample_row.h"
#include "host/store/store_history.h"
#include "host/store/store_importer.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

TEST_F(StoreTest, ScalarsComeInOrderOfDayAndKeyFromTheHalfOpenRange) {
  for (const std::int32_t day : {12, 10, 11, -5}) {
    for (const char* key : {"b", "a", "B", "\xc3\xa9", "aa"}) ASSERT_TRUE(set(day, key, day));
  }
  ASSERT_TRUE(set(11, "a", std::numeric_limits<std::int64_t>::min()));
  EXPECT_THAT(scalars("", 10, 12), ElementsAre("11 B=11", "11 a=-9223372036854775808", "11 aa=11",
                                               "11 b=11", "11 \xc3\xa9=11", "12 B=12", "12 a=12",
                                               "12 aa=12", "12 b=12", "12 \xc3\xa9=12"));
  EXPECT_THAT(scalars("a", kFirst, 10), ElementsAre("-5 a=-5", "-5 aa=-5", "10 a=10", "10 aa=10"));
  EXPECT_THAT(scalars("\xff\xff"), IsEmpty());
  EXPECT_EQ(scalars("\xc3").size(), 4u);
  EXPECT_THAT(scalars("", 12, 12), IsEmpty());
  int rows = 0;
  store()->openHistory()->enumerateScalars(
      "", kFirst, kLast,
      [&](std::string_view, std::int32_t, std::int64_t, bool& stop) { stop = ++rows == 3; });
  EXPECT_EQ(rows, 3);
}

TEST_F(StoreTest, SamplesComeBackBitForBitInRecordedOrderHoweverTheyAreStored) {
  const double odd[] = {-0.0, std::numeric_limits<double>::infinity(), std::nan(""), 5e-324,
                        -1e300};
  std::vector<double> expected;
  const auto record = [&](std::vector<double> values, bool inOrder) {
    ASSERT_TRUE(push(kToday, "d", values, inOrder));
    expected.insert(expected.end(), values.begin(), values.end());
  };
  const auto check = [&](const char* when) {
    for (const std::size_t batch : {std::size_t{1}, std::size_t{999}, 3 * kMostRowSamples}) {
      const auto rows = distributions("d", kFirst, kLast, batch);
      ASSERT_EQ(rows.size(), 1u) << when;
      ASSERT_EQ(rows[0].values.size(), expected.size()) << when;
      EXPECT_EQ(std::memcmp(rows[0].values.data(), expected.data(), expected.size() * 8), 0)
          << when << ", " << batch << " at a time";
      EXPECT_EQ(rows[0].offsets[4], 4u);
      EXPECT_EQ(rows[0].offsets[5], 0u) << "the first of the second push";
    }
  };
  record({odd, odd + 5}, false);
  record(sequence(0, 2 * kMostRowSamples + 3), false);
  check("pushed");
  store()->TBClientCheckpoint();
  EXPECT_EQ(sql("SELECT count(*) FROM arrivals"), "0");
  check("folded");
  record(sequence(7, 10), true);
  record(sequence(1e9, kMostRowSamples), true);
  record({1}, false);
  check("folded and new ones");
  ASSERT_TRUE(write([](StoreWriter& writer) -> Status {
    const auto complete = writer.foldRecentUntil({});  // a time that is up
    return complete && !*complete ? Status(Done{}) : Error{"not a part"};
  }));
  check("folded in part");
  store()->TBClientCheckpoint();
  check("folded again");
  EXPECT_EQ(sql("SELECT sum(samples) FROM series"), std::to_string(expected.size()));
  EXPECT_EQ(sql("SELECT count(*) < 2 FROM series WHERE samples < 20"), "1")
      << "small rows are merged";
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(StoreTest, DistributionsOfBothTablesAreOneSeriesInOrder) {
  clock->setDay(12);
  ASSERT_TRUE(push(11, "b", {1}) && push(10, "c", {1, 2}) && push(10, "a", {1}));
  store()->TBClientCheckpoint();
  ASSERT_TRUE(push(10, "b", {1}) && push(10, "c", {3}) && push(11, "a", {1}) && push(12, "z", {1}));
  EXPECT_THAT(lengths(),
              ElementsAre("10 a x1", "10 b x1", "10 c x3", "11 a x1", "11 b x1", "12 z x1"));
  std::vector<std::string> keys;
  store()->openHistory()->enumerateDistributions(
      "", 9, 11, [&](std::string_view key, std::int32_t, DistributionValues& values, bool& stop) {
        double value = 0;
        if (key == "c") values.nextValue(&value, nullptr);  // and leaves the rest
        keys.emplace_back(key);
        stop = keys.size() == 4;
      });
  EXPECT_THAT(keys, ElementsAre("a", "b", "c", "a"));
}

TEST_F(StoreTest, ACheckpointKeepsTheLatestThirtyDaysThatHoldDataHoweverTheClockGoes) {
  const auto record = [&](std::int32_t first, std::int32_t last) {
    for (std::int64_t day = first; day <= last; ++day) {
      ASSERT_TRUE(set(day, "s", day) && push(static_cast<std::int32_t>(day), "d", {1}));
    }
  };
  const auto checkpointOn = [&](std::int32_t day, std::uint64_t most = kMostStoreBytes) {
    clock->setDay(day);
    makeSqliteMetricsStore(storeFile, log, clock, most)->TBClientCheckpoint();
  };
  const auto left = [&](std::int32_t first, std::int32_t last) {
    return scalars("s", first - 1, last).size() + distributions("d", first - 1, last).size();
  };
  constexpr std::int32_t kDays = 30;
  const struct {
    const char* name;
    std::vector<std::int32_t> wrong;  // the days of runs under the wrong clock
    std::size_t wrongLeft;            // of them, after the clock is right again
  } cases[] = {
      {"a week ten years ahead", {24000, 24001, 24002, 24003, 24004, 24005, 24006}, 7},
      {"a week of boots in 1970", {0, 0, 1, 0}, 0},
      {"the ends of time", {kFirst, kLast - 1, kToday + 4000, kLast, 0}, 3},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove_all(at("data"));
    record(kToday - kDays - 4, kToday - 1);
    checkpointOn(kToday - 1);
    for (const std::int32_t day : c.wrong) {
      checkpointOn(day);
      record(day, day);
      EXPECT_EQ(left(kToday - kDays, kToday - 1), 2u * kDays) << "after a run on day " << day;
    }
    checkpointOn(kToday);
    EXPECT_EQ(left(kToday - kDays, kToday - 1), 2u * kDays);
    EXPECT_EQ(scalars().size(), kDays + c.wrongLeft);
    EXPECT_THAT(errors(), IsEmpty());
  }
  checkpointOn(kToday, 24u << 10);  // less than the tables alone take
  EXPECT_THAT(lengths(), ElementsAre("20513 d x1")) << "what is still to be reported stays";
  EXPECT_EQ(log->texts(LogLevel::Default).size(), 1u);
}

TEST_F(StoreTest, AStoreThatIsTooLargeFirstLosesWhatAWrongClockRecorded) {
  const struct {
    std::vector<std::int32_t> days;  // from the newest on
    std::vector<std::int32_t> order;
  } cases[] = {
      {{20014, 20013, 20012, 20011, 3, 2}, {2, 3, 20011, 20012}},
      {{24000, 20014, 20013, 20012, 19970, 19969}, {24000, 19969, 19970, 20012}},
      {{24001, 24000, 20000, 19999}, {24000, 24001, 19999, 20000}},  // as long: the farthest first
  };
  for (const auto& c : cases) EXPECT_EQ(leastCredibleDays(c.days, 20014), c.order);
  store()->TBClientSetValueForScalarKey("a", 1);
  sql("WITH RECURSIVE n(d) AS (SELECT 1 UNION ALL SELECT d + 40 FROM n LIMIT 5000) "
      "INSERT INTO scalars SELECT d, 'x', 0 FROM n");
  sql("INSERT INTO scalars VALUES (-1.5, 'x', 0), ('x', 'x', 0), (9e18, 'x', 0)");
  for (int run = 0; run < 3; ++run) store()->TBClientCheckpoint();
  EXPECT_EQ(sql("SELECT count(DISTINCT day) FROM scalars"), std::to_string(kMostDaysKept + 3))
      << "one day for each row: only the damaged rows are left beside the bound";
  EXPECT_THAT(scalars("a"), ElementsAre("20514 a=1"));
}

TEST_F(StoreTest, ABatchIsOneTransactionOfTheDayInProgress) {
  const auto writer = store();
  writer->beginBatch();
  writer->TBClientSetValueForScalarKey("a", 1);
  writer->beginBatch();
  writer->TBClientSetValueForScalarKey("b", 2);
  writer->endBatch();
  EXPECT_FALSE(std::filesystem::exists(path)) << "written before the outer batch ended";
  writer->endBatch();
  writer->TBClientSetValueForScalarKey("a", 3);
  EXPECT_THAT(scalars(), ElementsAre("20514 a=3", "20514 b=2"));
  EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms(0600));
  for (const std::string& key :
       {std::string(), std::string("a\0b", 3), std::string("\xff"), std::string(513, 'a')}) {
    log->lines.clear();
    store()->TBClientSetValueForScalarKey(key, 1);
    EXPECT_EQ(errors().size(), 1u) << key;
  }
  EXPECT_EQ(scalars().size(), 2u);
}

TEST_F(StoreTest, AMissingStoreHasNoRowsAndIsNotMadeByReading) {
  EXPECT_THAT(scalars(), IsEmpty());
  EXPECT_THAT(lengths(), IsEmpty());
  store()->TBClientCheckpoint();
  EXPECT_FALSE(std::filesystem::exists(at("data")));
  put("data/TBDataStore.sqlitedb", "");
  EXPECT_THAT(scalars(), IsEmpty()) << "as when its maker was killed at once";
  EXPECT_THAT(errors(), IsEmpty());
  store()->TBClientSetValueForScalarKey("a", 1);
  EXPECT_EQ(scalars().size(), 1u);
}

TEST_F(StoreTest, AnImportAboveItsBuffersKeepsTheOrderOfEachKey) {
  constexpr int kSamples = 1'300'000, kKeys = 7;
  for (int key = 0; key < kKeys; ++key) ASSERT_TRUE(push(1, std::to_string(key), {-1}));
  StoreImporter importer(storeFile);
  for (int i = 0; i < kSamples; ++i) {
    ASSERT_TRUE(importer.addSample(1, std::to_string(i % kKeys), 0, i));
  }
  EXPECT_EQ(lengths().size(), std::size_t{kKeys}) << "not seen before the end";
  EXPECT_EQ(distributions()[0].values.size(), 1u);
  ASSERT_TRUE(importer.finish());
  const auto rows = distributions();
  ASSERT_EQ(rows.size(), std::size_t{kKeys});
  std::size_t samples = 0;
  for (const auto& row : rows) {
    samples += row.values.size();
    EXPECT_EQ(row.values[0], -1) << "what was pushed before comes first";
    EXPECT_TRUE(std::is_sorted(row.values.begin(), row.values.end()));
  }
  EXPECT_EQ(samples, std::size_t{kSamples + kKeys});
}

TEST_F(StoreTest, ManyCanMakeTheStoreAndWriteAtOnce) {
  runTogether(6, 20, [&](int number, int i) {
    const auto mine = store();
    mine->TBClientSetValueForScalarKey(std::to_string(number) + "." + std::to_string(i), i);
    const bool pushed = push(kToday, "d", {1.0 * number});
    if (i % 5 == 0) mine->TBClientCheckpoint();
    return pushed && log->lines.empty();
  });
  EXPECT_EQ(scalars().size(), 120u);
  EXPECT_THAT(lengths(), ElementsAre("20514 d x120"));
}

TEST_F(StoreTest, TheWearOfDisksIsKeptInATableThatIsMadeWhenItIsNeeded) {
  const WearRow first{kToday - 400, {0, 10}, std::nullopt, std::nullopt},
      second{kToday, {100, std::nullopt}, 5, INT64_MAX};
  ASSERT_TRUE(set(kToday, "a", 1));
  EXPECT_THAT(store()->wearHistory("disk"), IsEmpty()) << "a store of before";
  const auto writer = store();
  writer->beginBatch();
  writer->addWear("disk", second);
  writer->addWear("disk", first);
  writer->addWear("other", first);
  writer->addWear("disk", {100, {1, 2}, std::nullopt, std::nullopt});  // the clock is not set
  EXPECT_THAT(store()->wearHistory("disk"), IsEmpty()) << "not before the batch ends";
  writer->endBatch();
  writer->addWear("disk", first);
  EXPECT_THAT(store()->wearHistory("disk"), ElementsAre(first, second));
  store()->TBClientCheckpoint();  // forgets days, but no wear
  EXPECT_THAT(scalars(), ElementsAre("20514 a=1"));
  sql("INSERT INTO wear VALUES ('disk', 20000, 'x', 1, 1, 1), ('disk', 20001, 9, 8, 1, 1), "
      "('disk', 99999999999, 1, 1, 1, 1), ('disk', -1, 1, 1, 1, 1), "
      "('disk', 20515, 7, NULL, -1, 'y')");
  EXPECT_THAT(store()->wearHistory("disk"),
              ElementsAre(first, second, WearRow{20515, {7, std::nullopt}, {}, {}}))
      << "damaged rows are left out";
  EXPECT_THAT(errors(), IsEmpty());
}

}  // namespace
}  // namespace tally
