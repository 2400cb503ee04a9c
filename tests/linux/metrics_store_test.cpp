// The metrics store on disk: what comes back, in which order, and what faults leave of it.
#include <gmock/gmock.h>
#include <sqlite3.h>

#include <cmath>
#include <cstring>
#include <limits>

#include "linux/temporary_root.h"
#include "platform/linux/metrics_store.h"
#include "platform/linux/sample_chunk.h"
#include "platform/linux/store_history.h"
#include "platform/linux/store_writer.h"

namespace tally {
namespace {

constexpr std::int32_t kToday = 20514;
constexpr std::int32_t kFirst = std::numeric_limits<std::int32_t>::min();
constexpr std::int32_t kLast = std::numeric_limits<std::int32_t>::max();

std::vector<double> sequence(double first, std::size_t count) {
  std::vector<double> values(count);
  for (std::size_t i = 0; i < count; ++i) values[i] = first + static_cast<double>(i);
  return values;
}

class StoreTest : public TemporaryRoot {
 protected:
  StoreTest() { clock->setDay(kToday, 3600); }

  std::shared_ptr<MetricsStore> store() const { return makeSqliteMetricsStore(path, log, clock); }

  template <class Work>
  bool write(const Work& work) const {
    auto writer = StoreWriter::open(path, IfMissing::Create);
    return writer && (*writer)->begin() && work(**writer) && (*writer)->commit();
  }
  // Each value one second after the one before.
  bool push(std::int32_t day, std::string_view key, const std::vector<double>& values,
            bool toChunks = false) const {
    std::vector<std::uint32_t> offsets(values.size());
    for (std::size_t i = 0; i < offsets.size(); ++i) offsets[i] = static_cast<std::uint32_t>(i);
    return write([&](StoreWriter& writer) -> Status {
      return toChunks ? writer.appendToChunks(day, key, values, offsets)
                      : writer.pushSamples(day, key, values, offsets);
    });
  }

  // "20513 key=7" for each row.
  std::vector<std::string> scalars(std::string_view prefix = "", std::int32_t minimum = kFirst,
                                   std::int32_t maximum = kLast) const {
    std::vector<std::string> rows;
    store()->openHistory()->enumerateScalars(
        prefix, minimum, maximum,
        [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
          rows.push_back(std::to_string(day) + " " + std::string(key) + "=" +
                         std::to_string(value));
        });
    return rows;
  }

  struct Distribution {
    std::int32_t day;
    std::string key;
    std::vector<double> values;
    std::vector<std::uint32_t> offsets;
  };
  std::vector<Distribution> distributions(std::string_view prefix = "",
                                          std::int32_t minimum = kFirst,
                                          std::int32_t maximum = kLast,
                                          std::size_t batch = 1000) const {
    std::vector<Distribution> rows;
    store()->openHistory()->enumerateDistributions(
        prefix, minimum, maximum,
        [&](std::string_view key, std::int32_t day, DistributionValues& values, bool&) {
          Distribution row{day, std::string(key), {}, {}};
          std::vector<double> some(batch);
          std::vector<std::uint32_t> seconds(batch);
          while (const auto count = values.nextValues(some.data(), seconds.data(), batch)) {
            row.values.insert(row.values.end(), some.begin(), some.begin() + std::ptrdiff_t(count));
            row.offsets.insert(row.offsets.end(), seconds.begin(),
                               seconds.begin() + std::ptrdiff_t(count));
          }
          rows.push_back(std::move(row));
        });
    return rows;
  }
  // As "20513 key x3" for each row.
  std::vector<std::string> lengths() const {
    std::vector<std::string> rows;
    for (const auto& row : distributions()) {
      rows.push_back(std::to_string(row.day) + " " + row.key + " x" +
                     std::to_string(row.values.size()));
    }
    return rows;
  }

  // Runs SQL behind the program's back; the first column of the last row.
  std::string sql(const char* text) const {
    sqlite3* handle = nullptr;
    EXPECT_EQ(::sqlite3_open(path.c_str(), &handle), SQLITE_OK);
    std::string answer;
    char* message = nullptr;
    ::sqlite3_exec(
        handle, text,
        [](void* out, int, char** columns, char**) {
          *static_cast<std::string*>(out) = columns[0] != nullptr ? columns[0] : "NULL";
          return 0;
        },
        &answer, &message);
    EXPECT_EQ(message, nullptr) << message;
    ::sqlite3_free(message);
    ::sqlite3_close(handle);
    return answer;
  }

  std::string path = at("data/TBDataStore.sqlitedb");
  std::shared_ptr<fakes::FakeClock> clock = std::make_shared<fakes::FakeClock>();
};

using testing::ElementsAre;
using testing::IsEmpty;

TEST_F(StoreTest, ScalarsComeInOrderOfDayAndKeyFromTheHalfOpenRange) {
  ASSERT_TRUE(write([](StoreWriter& writer) -> Status {
    for (const std::int32_t day : {12, 10, 11, -5}) {
      for (const char* key : {"b", "a", "B", "\xc3\xa9", "aa"}) {
        if (auto set = writer.setScalar(day, key, day); !set) return set;
      }
    }
    return writer.setScalar(11, "a", std::numeric_limits<std::int64_t>::min());
  }));
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
  const auto record = [&](std::vector<double> values, bool toChunks) {
    ASSERT_TRUE(push(kToday, "d", values, toChunks));
    expected.insert(expected.end(), values.begin(), values.end());
  };
  const auto check = [&](const char* when) {
    for (const std::size_t batch : {std::size_t{1}, std::size_t{999}, 3 * kChunkSamples}) {
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
  record(sequence(0, 2 * kChunkSamples + 3), false);
  check("pushed");
  store()->TBClientCheckpoint();
  EXPECT_EQ(sql("SELECT count(*) FROM recent"), "0");
  check("folded");
  record(sequence(7, 10), true);
  record(sequence(1e9, kChunkSamples), true);
  record({1}, false);
  check("chunks and new ones");
  store()->TBClientCheckpoint();
  check("folded again");
  EXPECT_EQ(
      sql("SELECT count(*) || ' ' || sum(samples) FROM chunks"),
      std::to_string(expected.size() / kChunkSamples + 1) + " " + std::to_string(expected.size()))
      << "small chunks are merged";
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

TEST_F(StoreTest, ACheckpointForgetsDaysOlderThanThirty) {
  for (const std::int32_t day : {kToday - 31, kToday - 30, kToday, kToday + 5}) {
    ASSERT_TRUE(push(day, "d", {1, 2}));
    ASSERT_TRUE(write([&](StoreWriter& writer) { return writer.setScalar(day, "s", 1); }));
  }
  store()->TBClientCheckpoint();
  EXPECT_THAT(scalars(), ElementsAre("20484 s=1", "20514 s=1", "20519 s=1"));
  EXPECT_THAT(lengths(), ElementsAre("20484 d x2", "20514 d x2", "20519 d x2"));
  clock->setDay(kToday + 1);
  store()->TBClientCheckpoint();
  EXPECT_EQ(lengths().size(), 2u) << "also with nothing to fold";
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

}  // namespace
}  // namespace tally
