// How samples are packed in the store, and what becomes of a store of the schema of before.
#include <bit>
#include <cmath>
#include <csignal>
#include <cstring>
#include <random>

#include <sys/resource.h>
#include <sys/wait.h>

#include "host/store/samples/sample_row.h"
#include "host/store/store_history.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

SampleRow::Shape shapeOf(const PackedRow& row, const SampleColumns& samples) {
  return {std::ssize(samples.values), static_cast<std::int64_t>(weightOf(samples)),
          std::ssize(row.values), std::ssize(row.weights), std::ssize(row.offsets)};
}

template <class T>
std::vector<T> oneByOne(std::size_t count, std::size_t step, const auto& unpack) {
  std::vector<T> all(count);
  for (std::size_t first = 0; first < count; first += step) {
    unpack(first, std::span(all).subspan(first, std::min(step, count - first)));
  }
  return all;
}

TEST(SampleRows, EverySampleComesBackBitForBitInAsFewBitsAsItNeeds) {
  const double infinity = std::numeric_limits<double>::infinity();
  const double odd = std::bit_cast<double>(0x7ff0'0000'dead'beefu);  // a NaN with a payload
  std::mt19937_64 random(5);
  const auto whole = [&](std::uint64_t bits, double scale = 1) {
    return [&random, bits, scale] { return static_cast<double>(random() >> (64 - bits)) / scale; };
  };
  const auto oneOf = [&](std::vector<double> pool) {
    return [&random, pool] { return pool[static_cast<std::size_t>(random()) % pool.size()]; };
  };
  const struct {
    const char* name;
    std::function<double()> draw;
    double bits;  // of each value, at most, in a full row
  } cases[] = {
      {"one", oneOf({odd}), 0},
      {"two", oneOf({7, 8}), 1},
      {"thousandths", whole(11, 1000), 11},
      {"with outliers", [&] { return random() % 100 == 0 ? 3e9 : double(random() % 64); }, 6.6},
      {"below 0", [&] { return (-1 - double(random() % 4096)) / 10; }, 12},
      {"wide", whole(29), 29},
      {"wider", whole(43, 100), 43},
      {"widest", whole(52), 52},
      {"far from 0", [&] { return 9e15 + double(random() % 256); }, 8},
      {"zeros of both signs", oneOf({0.0, -0.0}), 32},
      {"floats", [&] { return double(std::bit_cast<float>(std::uint32_t(random()) & 0xff7fffff)); },
       32},
      {"hostile", oneOf({odd, -0.0, 5e-324, 1.7e308, -infinity, infinity, std::nan("")}), 64},
      {"any", [&] { return std::bit_cast<double>(random()); }, 64},
  };
  // Differences of offsets below each: equal ones, usual ones, outliers, and clocks that step back.
  const std::uint32_t widths[] = {1, 40, 100'000, 0};
  for (const auto& c : cases) {
    for (const std::size_t count : {1, 2, 3, 9, 1000, 4096, int{kMostRowSamples}}) {
      for (const std::uint32_t width : widths) {
        SCOPED_TRACE(testing::Message() << c.name << " x" << count << ", " << width);
        std::vector<double> values(count);
        std::vector<std::uint32_t> offsets(count), weights(width == 40 ? count : 0);
        std::ranges::generate(values, c.draw);
        std::uint32_t offset = 86000;
        for (std::uint32_t& at : offsets) {
          const auto drawn = static_cast<std::uint32_t>(random());
          at = offset += width == 0 ? drawn : drawn % 64 == 0 ? drawn % width : drawn % width % 64;
        }
        for (std::uint32_t& weight : weights) {
          weight = random() % 200 == 0 ? UINT32_MAX : static_cast<std::uint32_t>(1 + random() % 9);
        }
        if (!weights.empty()) weights[0] = 2;
        const SampleColumns samples{values, offsets, weights};
        const PackedRow packed = packRow(samples);
        SampleRow row;
        ASSERT_TRUE(row.open(shapeOf(packed, samples), packed.values));
        for (const std::size_t step : {count, std::size_t{7}}) {
          const auto gotValues = oneByOne<double>(
              count, step, [&](auto first, auto out) { row.unpackValues(first, out); });
          EXPECT_EQ(std::memcmp(gotValues.data(), values.data(), count * sizeof(double)), 0);
          EXPECT_EQ(oneByOne<std::uint32_t>(count, step,
                                            [&](auto first, auto out) {
                                              row.unpackOffsets(packed.offsets, first, out);
                                            }),
                    offsets);
          if (weights.empty()) continue;
          EXPECT_EQ(oneByOne<std::uint32_t>(count, step,
                                            [&](auto first, auto out) {
                                              row.unpackWeights(packed.weights, first, out);
                                            }),
                    weights);
        }
        std::uint32_t last = 0;  // out of order
        row.unpackOffsets(packed.offsets, count - 1, {&last, 1});
        EXPECT_EQ(last, offsets.back());
        if (count < kMostRowSamples) continue;
        const double header = 8 * 20, bits = c.bits * static_cast<double>(count);
        EXPECT_LE(static_cast<double>(8 * packed.values.size()), bits + header);
        EXPECT_LE(packed.offsets.size(), width == 1 ? 8 : width == 0 ? 8 + 4 * count : count);
      }
    }
  }
}

TEST(SampleRows, ARowThatWasChangedIsRefusedOrGivesOtherSamples) {
  std::mt19937 random(3);
  std::vector<double> values(300);
  std::vector<std::uint32_t> offsets(300, 5), weights(300, 2);
  for (std::size_t i = 0; i < values.size(); ++i) {
    values[i] = i % 50 == 0 ? 1e9 : static_cast<double>(random() % 100);
    offsets[i] = static_cast<std::uint32_t>(random() % 100);
    weights[i] = i % 90 == 0 ? 1'000'000 : 3;
  }
  const SampleColumns samples{values, offsets, weights};
  const PackedRow packed = packRow(samples);
  for (int round = 0; round < 3000; ++round) {
    PackedRow spoiled = packed;
    for (auto* const column : {&spoiled.values, &spoiled.weights, &spoiled.offsets}) {
      const std::size_t reach =
          round % 2 == 0 ? std::min<std::size_t>(column->size(), 11) : column->size();
      (*column)[static_cast<std::size_t>(random()) % reach] = static_cast<std::byte>(random());
      if (round % 5 == 0) column->resize(column->size() - static_cast<std::size_t>(random() % 2));
    }
    SampleRow::Shape shape = shapeOf(spoiled, samples);
    if (round % 7 == 0) shape.samples += static_cast<int>(random() % 3) - 1;
    SampleRow row;
    if (!row.open(shape, spoiled.values)) continue;
    row.unpackValues(0, std::span(values).first(row.size()));
    row.unpackWeights(spoiled.weights, 0, std::span(weights).first(row.size()));
    row.unpackOffsets(spoiled.offsets, 1, std::span(offsets).first(row.size() - 1));
    row.unpackOffsets({}, 1, std::span(offsets).first(row.size() - 1));
  }
}

class ConversionTest : public StoreTest {
 protected:
  // Samples in all tables that a store of before may have; some of a key in each.
  void makeFormerStore() {
    makeRawStore();
    const std::vector<double> odd{-0.0, std::nan(""), 5e-324, 0.1, 1e300};
    for (int number = 0; number < 3; ++number) {
      std::vector<std::uint32_t> offsets(odd.size(), static_cast<std::uint32_t>(number));
      for (const char* const table : {"chunks", "recent"}) {
        addRaw(table, kToday, "all", number, odd, offsets);
        addRaw(table, kFirst, std::string("first.") + table, number, odd, offsets);
      }
    }
    for (int key = 0; key < 40; ++key) {
      addRaw("chunks", kToday - 1, "key" + std::to_string(key), key,
             sequence(1.0 / (1 + key % 3), 300), std::vector<std::uint32_t>(300, 9));
    }
    const std::vector<std::uint32_t> offsets(odd.size(), 5), weights(odd.size(), 10);
    ASSERT_TRUE(write([&](StoreWriter& writer) -> Status {
      for (const char* const key : {"all", "weighted"}) {
        if (auto done = writer.appendSamples(kToday, key, {odd, offsets, weights}); !done)
          return done;
      }
      return writer.pushSamples(kToday, "all", odd, offsets);
    }));
    store()->TBClientSetValueForScalarKey("scalar", 1);
  }
  // All that the store holds, bit for bit.
  std::string content() const {
    std::string text;
    for (const Distribution& row : distributions("", kFirst, kLast, 7)) {
      text += std::to_string(row.day) + row.key;
      for (const auto column :
           {std::as_bytes(std::span(row.values)), std::as_bytes(std::span(row.offsets)),
            std::as_bytes(std::span(row.weights))}) {
        text.append(reinterpret_cast<const char*>(column.data()), column.size());
      }
    }
    listStoreKeys(
        storeFile,
        [&](const StoreKey& key) {
          text += fmt::format("{} {} {};", key.key, key.days, key.samples);
        },
        [&](const std::string& fault) { text += fault; });
    return text;
  }
  Status convert(std::vector<std::string>* faults = nullptr) const {
    auto writer = StoreWriter::open(storeFile, IfMissing::Leave);
    if (!writer) return writer.error();
    return (*writer)->convertToPackedSchema([&](const std::string& fault) {
      if (faults != nullptr) faults->push_back(fault);
    });
  }
};

TEST_F(ConversionTest, AllSamplesStayBitForBitInTheirOrder) {
  makeFormerStore();
  const std::string before = content();
  EXPECT_EQ(sql("PRAGMA user_version"), "1");
  ASSERT_TRUE(convert() && convert());
  EXPECT_EQ(sql("PRAGMA user_version"), "2");
  EXPECT_EQ(content(), before);
  EXPECT_EQ(sql("SELECT group_concat(name) FROM sqlite_schema"), "scalars,arrivals,series");
  store()->TBClientCheckpoint();
  EXPECT_EQ(content(), before) << "what had arrived was put in order";
  EXPECT_THAT(scalars(), ElementsAre("20514 scalar=1"));
  EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(ConversionTest, DamagedRowsGoWithOneLineAndADamagedFileStaysAsItIs) {
  makeFormerStore();
  const std::string before = content();
  sql("INSERT INTO chunks VALUES (1, 'lie', 0, 3, zeroblob(16), zeroblob(8)), "
      "(1, 'lie', 1, 3, zeroblob(24), zeroblob(8))");
  std::vector<std::string> faults;
  ASSERT_TRUE(convert(&faults));
  EXPECT_THAT(faults, ElementsAre(HasSubstr("2 damaged rows are left out")));
  EXPECT_EQ(content(), before);

  std::filesystem::remove_all(at("data"));
  makeFormerStore();
  const auto page = std::stoul(sql("SELECT rootpage - 1 FROM sqlite_schema WHERE name = 'chunks'"));
  std::string spoiled = get("data/TBDataStore.sqlitedb");
  spoiled.replace(page * 8192, 1000, 1000, '\x7f');
  put("data/TBDataStore.sqlitedb", spoiled);
  EXPECT_FALSE(convert());
  EXPECT_EQ(sql("PRAGMA user_version"), "1");
  EXPECT_TRUE(push(kToday, "more", {1})) << "recording goes on";
}

// Each start ends the conversion a little later: by a kill, or by a limit that is as a full disk.
TEST_F(ConversionTest, AKillOrAFullDiskLeavesTheStoreAsItWas) {
  makeFormerStore();
  const std::string before = content();
  const std::string whole = get("data/TBDataStore.sqlitedb");
  int converted = 0, stayed = 0;
  for (int round = 0; round < 40; ++round) {
    for (const auto& file : names("data")) std::filesystem::remove(at("data/" + file));
    put("data/TBDataStore.sqlitedb", whole);
    const pid_t child = ::fork();
    if (child == 0) {
      const auto bytes = static_cast<rlim_t>(round * 40000);
      const rlimit limit{bytes, bytes};
      if (round % 2 == 0) ::signal(SIGXFSZ, SIG_IGN);  // a write fails; else it kills
      ::setrlimit(RLIMIT_FSIZE, &limit);
      ::_exit(convert() ? 0 : 1);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    const bool isDone = WIFEXITED(status) && WEXITSTATUS(status) == 0;
    const bool isConverted = sql("PRAGMA user_version") == "2";
    EXPECT_TRUE(isConverted || !isDone) << round;  // a kill may also come after the commit
    ++(isConverted ? converted : stayed);
    ASSERT_EQ(content(), before) << round;
    EXPECT_EQ(sql("PRAGMA integrity_check"), "ok");
    EXPECT_TRUE(push(kToday, "more", {1})) << round;
  }
  EXPECT_GT(converted, 5);
  EXPECT_GT(stayed, 5);
}

}  // namespace
}  // namespace tally
