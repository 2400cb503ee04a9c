// Bucketing and summarising, at their limits.
#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cmath>
#include <limits>
#include <random>

#include "fakes/fake_platform.h"
#include "report/distribution_pass.h"
#include "report/distribution_summary.h"
#include "report/histogram.h"

namespace tally {
namespace {

constexpr double kInfinity = std::numeric_limits<double>::infinity();

KvRef<KvArray> boundaries(const std::vector<double>& values) {
  auto array = KvArray::create();
  for (const double value : values) {
    const bool integer = std::trunc(value) == value && std::fabs(value) < 1e9;
    array->append(integer ? KvNumber::int64(static_cast<std::int64_t>(value))
                          : KvNumber::float64(value));
  }
  return array;
}

// What the search must agree with: the first boundary, in array order, at or above the value.
std::size_t scan(const std::vector<double>& values, double sample) {
  for (std::size_t i = 0; i < values.size(); ++i) {
    if (values[i] >= sample) return i;
  }
  return values.size();
}

TEST(Histogram, TheSearchAnswersLikeAScan) {
  const double nan = std::nan("");
  std::vector<std::vector<double>> sets = {{},
                                           {10},
                                           {10, 20},
                                           {2.5},
                                           {20, 10},
                                           {5, 5, 5},
                                           {3, 1, 4, 1, 5, 9, 2, 6},
                                           {nan, 1, nan, 2},
                                           {nan},
                                           {-kInfinity, 0, kInfinity},
                                           {kInfinity, 1},
                                           {-0.0, 0.0, 1e-300}};
  std::mt19937 random(7);
  for (std::size_t size = 1; size < 40; ++size) {
    std::vector<double> set;
    for (std::size_t i = 0; i < size; ++i) set.push_back(static_cast<double>(random() % 50));
    sets.push_back(set);
    std::sort(set.begin(), set.end());
    sets.push_back(set);
  }
  for (const auto& set : sets) {
    const auto array = boundaries(set);
    const HistogramIntervals intervals(*array);
    std::vector<double> probes = {nan, kInfinity, -kInfinity, 0, -0.0, 1e300, -1e300};
    for (const double boundary : set) {
      probes.insert(probes.end(), {boundary, std::nextafter(boundary, kInfinity),
                                   std::nextafter(boundary, -kInfinity)});
    }
    for (const double probe : probes) {
      ASSERT_EQ(intervals.bucketOf(probe), scan(set, probe))
          << kvText(array.get()) << " sample " << probe;
    }
    std::vector<std::uint64_t> counted(set.size() + 1), expected(set.size() + 1);
    intervals.count(probes, counted.data());
    for (const double probe : probes) ++expected[scan(set, probe)];
    ASSERT_EQ(counted, expected) << kvText(array.get());
  }
}

TEST(Histogram, LabelsShowTheNumbersOfTheWhitelist) {
  const auto array = KvArray::create({KvNumber::int64(10), KvNumber::float64(2.5),
                                      KvNumber::float64(300000), KvNumber::uint64(UINT64_MAX)});
  const HistogramIntervals intervals(*array);
  const char* labels[] = {"(-inf, 10]", "(10, 2.5]", "(2.5, 300000]",
                          "(300000, 18446744073709551615]", "(18446744073709551615, inf)"};
  ASSERT_EQ(intervals.bucketCount(), std::size(labels));
  for (std::size_t i = 0; i < std::size(labels); ++i) EXPECT_EQ(intervals.label(i), labels[i]);
  const auto none = KvArray::create();
  EXPECT_EQ(HistogramIntervals(*none).label(0), "(-inf, inf)");
}

TEST(DistributionSummary, TheFiveNumbers) {
  const double nan = std::nan("");
  const struct {
    const char* name;
    std::vector<double> samples;
    const char* expected;
  } cases[] = {
      {"none", {}, "0 0 0 0 0"},
      {"one", {-3.5}, "-3.5 -3.5 -3.5 0 1"},
      {"textbook", {2, 4, 4, 4, 5, 5, 7, 9}, "2 9 5 32 8"},
      {"a NaN inside changes neither end", {1, nan, 3}, "1 3 nan nan 3"},
      {"a NaN first stays", {nan, 3}, "nan nan nan nan 2"},
      {"infinite", {1, kInfinity}, "1 inf inf nan 2"},
  };
  for (const auto& c : cases) {
    // In batches of every size the figures are the same to the last bit.
    for (std::size_t batch = 1; batch <= c.samples.size() + 1; ++batch) {
      DistributionSummary summary;
      for (std::size_t i = 0; i < c.samples.size(); i += batch) {
        const std::size_t count = std::min(batch, c.samples.size() - i);
        summary.add(std::span(c.samples).subspan(i, count), {}, nullptr, {});
      }
      std::string text;
      const auto array = summary.toArray();
      for (const auto& item : *array) text += (text.empty() ? "" : " ") + kvText(item.get());
      EXPECT_EQ(text, c.expected) << c.name << ", batch " << batch;
    }
  }
}

class SampleList final : public DistributionValues {
 public:
  SampleList(std::vector<double> samples, bool isWeighted)
      : samples_(std::move(samples)), isWeighted_(isWeighted) {}
  std::size_t nextValues(double* values, std::uint32_t*, std::size_t capacity) override {
    const std::size_t count = std::min({capacity, samples_.size() - taken_, std::size_t{700}});
    std::copy_n(samples_.begin() + static_cast<std::ptrdiff_t>(taken_), count, values);
    taken_ += count;
    weights_.assign(isWeighted_ && taken_ > 900 ? count : 0, 3);
    return count;
  }
  std::span<const std::uint32_t> weights() const override { return weights_; }

 private:
  std::vector<double> samples_;
  std::vector<std::uint32_t> weights_;
  std::size_t taken_ = 0;
  bool isWeighted_;
};

std::string bitsOf(const DistributionResult& result) {
  std::string text;
  const auto& s = result.summary;
  for (const double number : {s.minimum, s.maximum, s.mean, s.squaredDeviations}) {
    // Which of several NaNs results is the processor's choice.
    text +=
        std::isnan(number) ? "nan " : std::to_string(std::bit_cast<std::uint64_t>(number)) + " ";
  }
  return text + std::to_string(s.count) + kvText(result.histogram.get());
}

TEST(DistributionPass, SideBySideHasTheBitsOfEachAlone) {
  fakes::FakeSystemLog log;
  std::mt19937_64 random(11);
  const auto none = ScalarOptions::create(), some = ScalarOptions::create();
  some->set("intervals", boundaries({-1, 0, 2.5, 1000}));
  const std::size_t sizes[] = {0,
                               1,
                               2,
                               255,
                               700,
                               1024,
                               5000,
                               DistributionPass::kMostKept - 1,
                               DistributionPass::kMostKept,
                               DistributionPass::kMostKept + 1,
                               40000};
  std::vector<std::string> expected, found;
  DistributionPass pass(log, [&](std::string_view key, const DistributionResult& result) {
    found.push_back(std::string(key) + bitsOf(result));
  });
  for (int i = 0; i < 150; ++i) {
    std::vector<double> samples(sizes[random() % std::size(sizes)]);
    for (double& sample : samples) {
      const std::uint64_t bits = random();
      sample = i % 3 == 0 ? std::bit_cast<double>(bits)  // NaNs, infinities, denormals
                          : static_cast<double>(bits % 100000) / 64;
    }
    const auto& options = i % 2 == 0 ? *none : *some;
    const std::string key = std::to_string(i) + ": ";
    SampleList alone(samples, i % 7 == 0), beside(samples, i % 7 == 0);
    expected.push_back(key + bitsOf(summariseDistribution(log, alone, key, options)));
    pass.add(beside, key, options);
  }
  pass.finish();
  EXPECT_EQ(found, expected);
}

TEST(DistributionSummary, TheCountSaturates) {
  DistributionSummary summary;
  summary.count = std::int64_t{1} << 40;
  EXPECT_EQ(kvText(summary.toArray()->get(4)), "2147483647");
  const double sample = 1;
  const std::uint32_t weight = UINT32_MAX;
  summary.count = INT64_MAX - 1;
  summary.add({&sample, 1}, {&weight, 1}, nullptr, {});
  EXPECT_GT(summary.count, std::int64_t{1} << 61);
}

TEST(DistributionSummary, AWeightCountsAsSoManySamples) {
  std::mt19937 random(3);
  const auto array = boundaries({0, 1, 2});
  const HistogramIntervals intervals(*array);
  DistributionSummary weighted, repeated;
  std::uint64_t weightedCounts[4] = {}, repeatedCounts[4] = {};
  for (int batch = 0; batch < 20; ++batch) {
    const bool withWeights = batch % 3 != 1;
    std::vector<double> samples, all;
    std::vector<std::uint32_t> weights;
    for (int i = 0; i < 30; ++i) {
      samples.push_back(static_cast<double>(random() % 4000) / 1000 - 1);
      weights.push_back(withWeights ? static_cast<std::uint32_t>(random() % 9 + 1) : 1);
      all.insert(all.end(), weights.back(), samples.back());
    }
    if (!withWeights) weights.clear();
    weighted.add(samples, weights, &intervals, weightedCounts);
    repeated.add(all, {}, &intervals, repeatedCounts);
  }
  EXPECT_EQ(weighted.count, repeated.count);
  EXPECT_EQ(weighted.minimum, repeated.minimum);
  EXPECT_EQ(weighted.maximum, repeated.maximum);
  EXPECT_NEAR(weighted.mean, repeated.mean, 1e-12);
  EXPECT_NEAR(weighted.squaredDeviations, repeated.squaredDeviations, 1e-8);
  EXPECT_TRUE(std::ranges::equal(weightedCounts, repeatedCounts));
  std::uint64_t counts[4] = {5, 0, std::uint64_t{UINT32_MAX} + 7, 0};
  EXPECT_EQ(kvText(makeHistogramDictionary(intervals, counts)->get("(1, 2]")), "4294967295");
}

}  // namespace
}  // namespace tally
