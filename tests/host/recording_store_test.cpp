// What the recorder writes: how samples are packed, and what becomes of a store while it records.
#include <bit>
#include <cmath>
#include <cstring>
#include <random>

#include "host/store/recording/recording_store.h"
#include "host/store/samples/packed_samples.h"
#include "host/store/store_importer.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using ChangeKind = RecordedChange::Kind;

template <class T>
bool sameBytes(const std::vector<T>& a, const std::vector<T>& b) {
  return a.size() == b.size() &&
         (a.empty() || std::memcmp(&a[0], &b[0], a.size() * sizeof(T)) == 0);
}

TEST(PackedSamples, EverySampleComesBackBitForBitInTheNarrowestForm) {
  const double infinity = std::numeric_limits<double>::infinity();
  const double odd = std::bit_cast<double>(0x7ff0'0000'dead'beefu);  // a NaN with a payload
  const double floatNan = std::bit_cast<double>(0x7ff4'0000'2000'0000u);
  const struct {
    const char* name;
    std::vector<double> pool;   // from which values are drawn
    std::size_t before, bytes;  // of all values, and of each
  } cases[] = {
      {"one", {odd}, 8, 0},
      {"milliseconds", {1200, 1201, 1455}, 8, 1},
      {"below 0", {-100, 0, 155}, 8, 1},
      {"a wide range", {-30000, 35535}, 8, 2},
      {"large ones", {9e15, 9e15 + 255}, 8, 1},
      {"tenths", {0.1, 12.5, 25.6}, 8, 1},
      {"micro", {0.000001, 4000.25}, 8, 4},
      {"a third", {1.0 / 3, 1}, 0, 8},
      {"zeros of both signs", {0.0, -0.0}, 0, 4},
      {"floats", {0.1f, 1e-30f, 3e38f, infinity, -infinity}, 0, 4},
      {"beyond", {1e16 + 2, 1}, 0, 8},
      {"far apart", {0, 5e9 + 1}, 0, 8},
      {"hostile", {odd, floatNan, -0.0, 5e-324, 1.7e308, -infinity, std::nan("")}, 0, 8},
  };
  std::minstd_rand random(5);
  for (const auto& c : cases) {
    for (const std::size_t count : {std::size_t{1}, std::size_t{7}, kMostPackedSamples}) {
      for (const std::uint32_t width : {1u, 2u, 200u, 40000u, 4294967295u}) {
        SCOPED_TRACE(testing::Message() << c.name << " x" << count << ", " << width);
        SampleVectors samples;
        for (std::size_t i = 0; i < count; ++i) {
          samples.values.push_back(c.pool[i % c.pool.size()]);
          samples.offsets.push_back(static_cast<std::uint32_t>(random()) % width * 2);
          samples.weights.push_back(
              1 + (i == 0 ? width - 1 : static_cast<std::uint32_t>(random()) % width));
        }
        if (width == 1) samples.offsets[0] = 4294967295u;  // and a clock that steps back
        const auto blob = packSamples(samples.columns());
        EXPECT_LE(blob.size(), kLongestPacked);
        SampleVectors unpacked;
        ASSERT_TRUE(unpackSamples(blob, PackedColumns::All, unpacked));
        EXPECT_TRUE(sameBytes(unpacked.values, samples.values));
        EXPECT_EQ(unpacked.offsets, samples.offsets);
        if (width == 1) {
          EXPECT_THAT(unpacked.weights, IsEmpty());
        } else {
          EXPECT_EQ(unpacked.weights, samples.weights);
        }
        if (count != kMostPackedSamples || width != 1) continue;
        EXPECT_EQ(blob.size(), kPackedHeader + c.before + (c.bytes + 1) * count - 1);
      }
    }
  }
}

TEST(PackedSamples, DamagedBlobsHoldNoSamples) {
  const std::vector<double> values{1, 2, 3.5};
  const std::vector<std::uint32_t> offsets{1, 2, 300}, weights{1, 5, 1000};
  const auto whole = packSamples({values, offsets, weights});
  const auto holds = [](std::span<const std::byte> blob) {
    SampleVectors out;
    return unpackSamples(blob, PackedColumns::All, out);
  };
  ASSERT_TRUE(holds(whole));
  for (std::size_t size = 0; size < whole.size(); ++size)
    EXPECT_FALSE(holds(std::span(whole).first(size)));
  const struct {
    std::size_t at;
    int byte;
  } damage[] = {{0, 0}, {0, 2}, {1, 6}, {1, 5}, {2, 7}, {3, 4},    {3, 3},
                {4, 5}, {4, 0}, {5, 1}, {6, 0}, {6, 4}, {7, 0x10}, {7, 0xff}};
  for (const auto& [at, byte] : damage) {
    auto spoiled = whole;
    spoiled[at] = static_cast<std::byte>(byte);
    EXPECT_FALSE(holds(spoiled)) << at << ": " << byte;
  }
}

class RecordingStoreTest : public StoreTest {
 protected:
  template <class Work>
  bool record(const Work& work) {
    auto transaction = recorder->begin();
    return transaction && work(**transaction) && (*transaction)->commit();
  }
  static RecordedChange change(ChangeKind kind, std::string_view key, std::int64_t value) {
    return {kind, key, value, {}, 7};
  }

  std::shared_ptr<RecordingStore> recorder = makeSqliteRecordingStore(storeFile);
};

TEST_F(RecordingStoreTest, ScalarsAndOwnersOfADayAreKeptAsAWholeOrNotAtAll) {
  EXPECT_EQ(*recorder->newestDay(), std::nullopt);
  EXPECT_FALSE(std::filesystem::exists(path)) << "reading makes nothing";
  constexpr auto kMost = std::numeric_limits<std::int64_t>::max();
  ASSERT_TRUE(record([&](RecordingTransaction& to) {
    return to.apply(1, change(ChangeKind::Add, "a", 2)) &&
           to.apply(1, change(ChangeKind::Add, "a", 3)) &&
           to.apply(1, change(ChangeKind::Set, "b", kMost)) &&
           to.apply(1, change(ChangeKind::Add, "b", 1)) &&
           to.apply(2, change(ChangeKind::Set, "c", -kMost)) &&
           to.apply(2, change(ChangeKind::Add, "c", -kMost)) &&
           to.apply(2, change(ChangeKind::Move, "a", -9)) && to.setOwner(1, {"a", 1000, false}) &&
           to.setOwner(1, {"a", 1001, true});
  }));
  EXPECT_THAT(scalars(), ElementsAre("1 a=5", "1 b=9223372036854775807", "2 a=-4",
                                     "2 c=-9223372036854775808"));
  {
    auto undone = recorder->begin();
    ASSERT_TRUE(undone && (*undone)->apply(3, change(ChangeKind::Add, "a", 1)));
    EXPECT_FALSE((*undone)->apply(3, change(ChangeKind::Add, std::string_view("\0", 1), 1)));
  }
  EXPECT_EQ(*recorder->newestDay(), 2);
  EXPECT_EQ(*recorder->scalar(1, "a"), 5);
  EXPECT_EQ(*recorder->scalar(2, "b"), std::nullopt);
  const auto owners = *recorder->owners(1);
  ASSERT_EQ(owners.size(), 1u);
  EXPECT_TRUE(owners[0].user == 1000 && !owners[0].distribution) << "the first one stays";
}

TEST_F(RecordingStoreTest, SamplesKeepTheirOrderAndWeightsWhereverTheyLie) {
  std::vector<double> expected;
  std::vector<std::uint32_t> expectedWeights;
  const auto add = [&](std::size_t count, std::uint32_t weight) {
    const auto values = sequence(static_cast<double>(expected.size()), count);
    const std::vector<std::uint32_t> offsets(count, 9), weights(weight == 0 ? 0 : count, weight);
    expected.insert(expected.end(), values.begin(), values.end());
    expectedWeights.resize(expected.size(), std::max(weight, 1u));
    return record([&](RecordingTransaction& to) {
      const RecordedChange all{ChangeKind::Samples, "d", 0, {values, offsets, weights}, 0};
      return to.apply(kToday, all) && to.apply(kToday - 1, all) &&
             to.apply(kToday, {ChangeKind::Samples, "c", 0, all.samples, 0});
    });
  };
  const auto check = [&](const char* when) {
    for (const std::size_t batch : {std::size_t{1}, std::size_t{999}, 3 * kMostPackedSamples}) {
      const auto rows = distributions("d", kFirst, kLast, batch);
      ASSERT_EQ(rows.size(), 2u) << when;
      EXPECT_EQ(rows[1].values, expected) << when << ", " << batch << " at a time";
      EXPECT_EQ(rows[1].weights, expectedWeights) << when;
      EXPECT_EQ(rows[1].offsets.back(), 9u);
    }
  };
  expected = sequence(0, 3);
  ASSERT_TRUE(push(kToday, "d", expected) && push(kToday - 1, "d", expected, true));
  ASSERT_TRUE(add(5, 0) && add(kMostPackedSamples, 7) && add(1, 0));
  check("arrived");
  EXPECT_TRUE(store()->openHistory()->hasWeights());
  ASSERT_TRUE(write([](StoreWriter& writer) -> Status {
    for (int turns = 0; turns < 3; ++turns) {  // of the pushed row, then of two that arrived
      const auto complete = writer.foldRecentUntil({});
      if (!complete || *complete) return Error{"not a part"};
    }
    return Done{};
  }));
  check("folded in part");
  sql("INSERT INTO arrivals SELECT 100, day, key, samples, samples, data FROM arrivals WHERE "
      "weight > samples LIMIT 1");
  store()->TBClientCheckpoint();
  EXPECT_EQ(sql("SELECT group_concat(number) FROM arrivals"), "100") << "a damaged row stays";
  sql("DELETE FROM arrivals");
  sql("INSERT INTO series VALUES (20514, 'd', 50, 1, 1, x'01', x'', x'')");
  check("folded");
  ASSERT_TRUE(add(3, 2));
  store()->TBClientCheckpoint();
  check("folded again");
  EXPECT_EQ(sql("SELECT count(*) < 5 FROM series WHERE key = 'c'"), "1") << "rows are filled";
  StoreImporter importer(storeFile);
  for (const std::uint32_t weight : {1u, 4u}) {
    ASSERT_TRUE(importer.addSample(kToday, "d", 9, weight, weight) &&
                importer.addSample(1, "new", 9, weight));
    expected.push_back(weight);
    expectedWeights.push_back(weight);
  }
  ASSERT_TRUE(importer.finish());
  check("imported");
  EXPECT_EQ(sql("SELECT count(*) FROM series WHERE key = 'new'"), "1");
  ASSERT_TRUE(record([&](RecordingTransaction& to) {
                return to.setOwner(kToday - 1, {"d", 1, true});
              }) &&
              add(1, 0));
  ASSERT_TRUE(write([](StoreWriter& writer) { return writer.forgetBefore(kToday); }));
  EXPECT_EQ(lengths().size(), 2u);
  EXPECT_THAT(*recorder->owners(kToday - 1), IsEmpty());
}

TEST_F(RecordingStoreTest, AddsOfSeveralProcessesAreNotLost) {
  runTogether(4, 40, [&](int number, int i) {
    if (number == 0) return set(kToday, std::to_string(i), i);
    auto mine = i == 0 ? recorder = makeSqliteRecordingStore(storeFile) : recorder;
    return record([&](RecordingTransaction& to) {
      return to.apply(kToday, change(ChangeKind::Add, "n", 1));
    });
  });
  EXPECT_EQ(*recorder->scalar(kToday, "n"), 120);
}

TEST_F(RecordingStoreTest, AStoreThatWasRemovedOrReplacedIsOpenedAgain) {
  const auto add = [&] {
    return record([&](RecordingTransaction& to) {
      return to.apply(kToday, change(ChangeKind::Add, "n", 1));
    });
  };
  ASSERT_TRUE(add() && add());
  for (const auto& file : names("data")) std::filesystem::remove(at("data/" + file));
  EXPECT_EQ(*recorder->scalar(kToday, "n"), std::nullopt);
  ASSERT_TRUE(add());
  EXPECT_THAT(scalars(), ElementsAre("20514 n=1"));
  std::filesystem::rename(at("data"), at("aside"));
  ASSERT_TRUE(set(kToday, "n", 10));
  const auto reader = store()->openHistory();  // the new log is in use
  ASSERT_TRUE(add());
  recorder->releaseMemory();
  EXPECT_EQ(*recorder->scalar(kToday, "n"), 11);
  recorder.reset();
  EXPECT_THAT(scalars(), ElementsAre("20514 n=11"));
}

TEST_F(RecordingStoreTest, UndatedChangesWaitForTheirBootInABoundedSpace) {
  const std::vector<double> values = sequence(1.0 / 3, kMostPackedSamples + 1);
  const std::vector<std::uint32_t> offsets(values.size(), 5), weights(values.size(), 3);
  const RecordedChange samples{ChangeKind::Samples, "d", 0, {values, offsets, weights}, 7};
  ASSERT_TRUE(record([&](RecordingTransaction& to) {
    return to.addUndated("boot", 9, change(ChangeKind::Add, "a", 2)) &&
           to.addUndated("other", 1, change(ChangeKind::Set, "b", 3)) &&
           to.addUndated("boot", 10, samples);
  }));
  sql("INSERT INTO undated VALUES (14, 'boot', 1, 9, 'kind', 0, NULL, 0, NULL), "
      "(15, 'boot', 1, 2, 'samples', 0, x'01', 0, NULL)");
  ASSERT_TRUE(record([&](RecordingTransaction& to) -> Status {
    const auto first = to.takeUndated("boot", 2), rest = to.takeUndated("boot", 9);
    EXPECT_EQ(first->size(), 2u);
    EXPECT_EQ(rest->size(), 1u);
    EXPECT_TRUE((*first)[0].kind == ChangeKind::Add && (*first)[0].value == 2 &&
                (*first)[0].user == 7);
    EXPECT_EQ((*first)[1].secondsSinceBoot, 10);
    EXPECT_EQ((*rest)[0].values, std::vector<double>{values.back()});
    EXPECT_EQ((*rest)[0].weights, std::vector<std::uint32_t>{3});
    EXPECT_EQ(to.takeUndated("boot", 9)->size(), 0u);
    EXPECT_EQ(*to.forgetUndated(kToday), 0u);
    EXPECT_EQ(*to.forgetUndated(kToday - 9), 0u) << "the clock stepped back";
    EXPECT_EQ(*to.forgetUndated(kToday + 20), 0u);
    EXPECT_EQ(*to.forgetUndated(kToday + 21), 3u);
    for (int i = 0; i < 300; ++i) {
      if (auto added = to.addUndated("boot", i, samples); !added) return added;
    }
    EXPECT_GT(*to.forgetUndated(std::nullopt), 0u);
    EXPECT_EQ(*to.forgetUndated(std::nullopt), 0u);
    EXPECT_GT(to.takeUndated("boot", 1)->at(0).secondsSinceBoot, 0) << "the oldest went";
    return Done{};
  }));
}

}  // namespace
}  // namespace tally
