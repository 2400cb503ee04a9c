// The value model: order, look-up, conversion, sharing and text.
#include "kv/value.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <limits>
#include <map>
#include <random>
#include <thread>

namespace tally {
namespace {

TEST(KvDictionary, KeepsTheOrderOfInsertionAtEverySize) {
  // A random walk of sets and removals beside a plain list of pairs.
  std::mt19937 random(3);
  for (const unsigned keys : {5u, 12u, 13u, 200u}) {
    auto dictionary = KvDictionary::create();
    std::vector<std::pair<std::string, std::int64_t>> expected;
    for (int step = 0; step < 2000; ++step) {
      const std::string key = "key" + std::to_string(random() % keys);
      const auto place = std::find_if(expected.begin(), expected.end(),
                                      [&](const auto& pair) { return pair.first == key; });
      if (random() % 3 == 0) {
        EXPECT_EQ(dictionary->remove(key), place != expected.end());
        if (place != expected.end()) expected.erase(place);
      } else {
        const auto value = KvNumber::int64(step);
        random() % 2 == 0 ? dictionary->set(key, value)
                          : dictionary->set(KvString::create(key), value);
        (place != expected.end() ? *place : expected.emplace_back(key, 0)).second = step;
      }
      if (step % 97 == 0) {
        const auto copy = dictionary->copy();
        ASSERT_EQ(copy->size(), expected.size());
        std::size_t i = 0;
        for (const auto& entry : *copy) {
          ASSERT_EQ(entry.key->view(), expected[i].first);
          ASSERT_EQ(copy->getInt64(expected[i].first), expected[i].second);
          ++i;
        }
        ASSERT_FALSE(copy->contains("absent"));
      }
    }
  }
}

TEST(KvDictionary, MergeReplacesAndNullRemoves) {
  auto a = KvDictionary::create({{"x", KvNumber::int32(1)}, {"y", KvNumber::int32(2)}});
  a->merge(*KvDictionary::create({{"y", KvNumber::int32(3)}, {"z", KvNumber::int32(4)}}));
  a->set("x", nullptr);
  EXPECT_EQ(kvText(a.get()), "{\n    y = 3;\n    z = 4;\n}");
  EXPECT_EQ(a->getString("y"), std::nullopt);
  EXPECT_EQ(a->getAs<KvArray>("y"), nullptr);
}

TEST(KvNumber, ConversionsAreDefinedForEveryValue) {
  constexpr double kHuge = 1e300;
  const double nan = std::nan("");
  const struct {
    KvRef<KvNumber> number;
    std::int32_t int32;
    std::int64_t int64;
    std::uint64_t uint64;
    double real;
  } cases[] = {
      {KvNumber::int8(-1), -1, -1, UINT64_MAX, -1},
      {KvNumber::int64(0x1FFFFFFFF), -1, 0x1FFFFFFFF, 0x1FFFFFFFF, 8589934591.0},
      {KvNumber::uint32(UINT32_MAX), -1, UINT32_MAX, UINT32_MAX, 4294967295.0},
      {KvNumber::uint64(UINT64_MAX), -1, -1, UINT64_MAX, 18446744073709551616.0},
      {KvNumber::float64(-2.9), -2, -2, 0, -2.9},
      {KvNumber::float64(kHuge), INT32_MAX, INT64_MAX, UINT64_MAX, kHuge},
      {KvNumber::float64(-kHuge), INT32_MIN, INT64_MIN, 0, -kHuge},
      {KvNumber::float64(9223372036854775808.0), INT32_MAX, INT64_MAX, 9223372036854775808u,
       9223372036854775808.0},
      {KvNumber::float32(0.5f), 0, 0, 0, 0.5},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(kvText(c.number.get()));
    EXPECT_EQ(c.number->asInt32(), c.int32);
    EXPECT_EQ(c.number->asInt64(), c.int64);
    EXPECT_EQ(c.number->asUInt64(), c.uint64);
    EXPECT_EQ(c.number->asDouble(), c.real);
  }
  EXPECT_EQ(KvNumber::float64(nan)->asInt64(), 0);
}

TEST(KvEqual, ComparesContentNotWidth) {
  constexpr double kNan = std::numeric_limits<double>::quiet_NaN();
  const auto list = [](KvRef<KvObject> item) { return KvArray::create({std::move(item)}); };
  const struct {
    KvRef<KvObject> a, b;
    bool equal;
    bool identical = equal;
  } cases[] = {
      {KvNumber::int8(5), KvNumber::float64(5), true, false},
      {KvNumber::int64(9007199254740993), KvNumber::float64(9007199254740992.0), false},
      {list(KvNumber::int8(0)), list(KvNumber::float64(0)), true, false},
      {KvNumber::float64(0.0), KvNumber::float64(-0.0), true, false},
      {KvNumber::float64(kNan), KvNumber::float64(kNan), false, true},
      {KvNumber::int64(-1), KvNumber::uint64(UINT64_MAX), false},
      {KvNumber::int32(1), KvBoolean::of(true), false},
      {KvString::create("a"), KvString::create("b"), false},
      {list(KvDate::create(1)), list(KvDate::create(2)), false},
      {KvDictionary::create({{"a", KvNumber::int8(1)}, {"b", KvNumber::int8(2)}}),
       KvDictionary::create({{"b", KvNumber::int8(2)}, {"a", KvNumber::int8(1)}}), true},
      {KvDictionary::create({{"a", KvNumber::int8(1)}}), KvDictionary::create(), false},
      {nullptr, nullptr, true},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(kvEqual(c.a.get(), c.b.get()), c.equal) << kvText(c.a.get());
    EXPECT_EQ(kvEqual(c.b.get(), c.a.get()), c.equal) << kvText(c.a.get());
    EXPECT_EQ(kvIdentical(c.a.get(), c.b.get()), c.identical) << kvText(c.a.get());
  }
}

TEST(KvText, OneFormForAll) {
  const std::byte bytes[] = {std::byte{0xde}, std::byte{0x0a}};
  const auto value = KvDictionary::create(
      {{"list", KvArray::create({KvNumber::float64(2.5), KvNumber::float64(20)})},
       {"none", KvDictionary::create()},
       {"data", KvData::create(bytes)},
       {"date", KvDate::create(0)},
       {"yes", KvBoolean::of(true)},
       {"bad", KvString::create("a\xFF")}});
  EXPECT_EQ(kvText(value.get()),
            "{\n    list = (\n        2.5,\n        20\n    );\n    none = {\n    };\n"
            "    data = <de0a>;\n    date = 1970-01-01T00:00:00Z;\n    yes = 1;\n"
            "    bad = a\uFFFD;\n}");
  EXPECT_EQ(kvText(nullptr), "(null)");
  const auto cycle = KvArray::create();
  cycle->append(cycle);
  cycle->append(cycle);
  EXPECT_NE(kvText(cycle.get()).find("..."), std::string::npos);
  cycle->removeAt(0);
  cycle->removeAt(0);
}

TEST(KvArray, RemovesAndReplacesByPlace) {
  const auto array = KvArray::create();
  for (int i = 0; i < 8; ++i) array->append(KvNumber::int64(i));
  array->append(nullptr);
  array->removeAt(8);
  // Where sizes have 32 bits, the size of so many pointers would wrap around.
  EXPECT_THROW(KvArray::create(SIZE_MAX / 4 + 1), std::bad_alloc);
  array->removeAt(std::vector<std::size_t>{0, 3, 4, 7});
  array->replaceAt(1, KvString::create("x"));
  array->replaceAt(4, KvString::create("y"));
  array->removeAt(0);
  EXPECT_EQ(kvText(array->copy().get()), "(\n    x,\n    5,\n    6\n)");
}

TEST(KvArena, ValuesAreSharedByThreadsAndOutliveTheArena) {
  // A wrong count would free a value while it is in use, which the sanitizers see.
  std::vector<KvRef<KvData>> values;
  {
    KvArena arena;
    const std::vector<std::byte> bytes(1000, std::byte{7});
    for (int i = 0; i < 6000; ++i) values.push_back(KvData::create(bytes, &arena));
  }
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([values, t] {
      for (int round = 0; round < 20; ++round) {
        auto mine = values;
        std::shuffle(mine.begin(), mine.end(), std::mt19937(static_cast<unsigned>(t)));
      }
    });
  }
  values.clear();  // whichever thread ends last frees them
  for (auto& thread : threads) thread.join();
  EXPECT_TRUE(values.empty());
}

}  // namespace
}  // namespace tally
