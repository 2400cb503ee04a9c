// Values of sampled channels, bucket bounds, and scaling.
#include <cmath>
#include <limits>

#include "hwreport/channel_world.h"

namespace tally {
namespace {

using namespace tests;

constexpr auto kInvalidSigned = static_cast<std::int64_t>(kInvalid);

// Every way in which a channel's elements cannot be read as the format that is asked for.
std::vector<KvRef<KvDictionary>> unreadable(std::uint64_t format) {
  const auto with = [&](KvRef<KvObject> raw) {
    auto one = channel(0x41, typeWord(format, 1));
    if (raw) one->set("RawElements", raw);
    return one;
  };
  return {nullptr,
          KvDictionary::create(),
          with(nullptr),
          with(text("x")),
          with(KvData::create(std::vector<std::byte>(63))),
          with(KvData::create(run(0x41, typeWord(format == 1 ? 2 : 1, 1), {{{1, 2, 3, 4}}})))};
}

TEST(Values, UnreadableChannelsHaveTheAnswerOfAMissingValue) {
  for (const auto& one : unreadable(1))
    EXPECT_EQ(HwReportSimpleGetIntegerValue(one.get()), kInvalidSigned);
  for (const auto& one : unreadable(4))
    EXPECT_EQ(HwReportArrayGetValueAtIndex(one.get(), 0), kInvalidSigned);
  auto states = unreadable(2), buckets = unreadable(3);
  // States and buckets also need the legend's word for it.
  states.push_back(sampled(2, {{{1, 2, 3}, 5}}, 2));
  states.push_back(sampled(2, {{{1, 2, 3}, 5}}, 0));
  buckets.push_back(sampled(3, {{{1, 2, 3, 4}}}, 2));
  for (const auto& one : states) {
    for (const auto get :
         {HwReportStateGetIDForIndex, HwReportStateGetInTransitions, HwReportStateGetResidency})
      EXPECT_EQ(get(one.get(), 0), kInvalid);
    EXPECT_EQ(HwReportStateGetIndexForID(one.get(), 1), -1);
    EXPECT_EQ(HwReportStateGetNameForIndex(one.get(), 0), nullptr);
    EXPECT_TRUE(std::isnan(HwReportStateGetDutyCycle(one.get(), 0)));
    EXPECT_EQ(HwReportStateGetCurrent(one.get()), -1);
  }
  for (const auto& one : buckets) {
    EXPECT_EQ(HwReportHistogramGetBucketHits(one.get(), 0), kInvalid);
    for (const auto get : {HwReportHistogramGetBucketMinValue, HwReportHistogramGetBucketMaxValue,
                           HwReportHistogramGetBucketSum})
      EXPECT_EQ(get(one.get(), 0), kInvalidSigned);
    EXPECT_EQ(HwReportHistogramGetMinValue(one.get()), kInvalidSigned);
    EXPECT_EQ(HwReportHistogramGetMaxValue(one.get()), kInvalidSigned);
    EXPECT_EQ(HwReportHistogramGetBucketBounds(one.get(), 0, nullptr, nullptr), HwErrGeneral);
  }
}

TEST(Values, SimpleAndArray) {
  const auto one = sampled(1, {{{static_cast<std::uint64_t>(-5)}}});
  std::uint64_t unit = 3;
  EXPECT_EQ(HwReportSimpleGetIntegerValue(one.get(), &unit), -5);
  EXPECT_EQ(unit, kInvalid) << "the channel has none";
  one->set("HwReportChannelInfo", HwReportCreateUnitInfo(7ull << 56));
  HwReportSimpleGetIntegerValue(one.get(), &unit);
  EXPECT_EQ(unit, 7ull << 56);
  EXPECT_EQ(HwReportSimpleGetIntegerValue(sampled(1, {{{1}}, {{2}}}).get(), &unit), kInvalidSigned);
  const auto array = sampled(4, {{{0, 1, 2, 3}}, {{4, 5, 6, 7}}});
  for (std::int32_t i = 0; i < 8; ++i) EXPECT_EQ(HwReportArrayGetValueAtIndex(array.get(), i), i);
  for (const std::int32_t i : {-1, 8, INT32_MIN, INT32_MAX}) {
    EXPECT_EQ(HwReportArrayGetValueAtIndex(array.get(), i), kInvalidSigned);
  }
}

TEST(Values, States) {
  const auto states = sampled(2, {{{0x41, 10, 100}, 5}, {{0x42, 20, 300}, 9}, {{0x42, 30, 0}, 9}});
  EXPECT_EQ(HwReportStateGetCount(states.get()), 3);
  EXPECT_EQ(HwReportStateGetCount(sampled(1, {{{1}}}).get()), -1);
  EXPECT_EQ(HwReportStateGetIDForIndex(states.get(), 1), 0x42u);
  EXPECT_EQ(HwReportStateGetInTransitions(states.get(), 2), 30u);
  EXPECT_EQ(HwReportStateGetResidency(states.get(), 0), 100u);
  for (const std::int32_t i : {-1, 3})
    EXPECT_EQ(HwReportStateGetResidency(states.get(), i), kInvalid);
  EXPECT_EQ(HwReportStateGetIndexForID(states.get(), 0x42), 2) << "the highest";
  EXPECT_EQ(HwReportStateGetIndexForID(states.get(), 0x43), -1);
  EXPECT_EQ(HwReportStateGetDutyCycle(states.get(), 0), 0.25);
  EXPECT_EQ(HwReportStateGetDutyCycle(states.get(), 1), 0.75);
  EXPECT_TRUE(std::isnan(HwReportStateGetDutyCycle(states.get(), 3)));
  for (const auto& unknown :
       {sampled(2, {{{1, 1, 0}}}), sampled(2, {{{1, 1, 1}}, {{2, 1, kInvalid}}})}) {
    EXPECT_TRUE(std::isnan(HwReportStateGetDutyCycle(unknown.get(), 0)));
  }
  EXPECT_EQ(HwReportStateGetCurrent(states.get()), 1) << "of equal times the lower index";
  EXPECT_EQ(HwReportStateGetCurrent(sampled(2, {{{1}, 0}}).get()), -1);
  EXPECT_EQ(HwReportStateGetNameForIndex(states.get(), 2)->view(), "B");
  EXPECT_EQ(HwReportStateGetNameForIndex(states.get(), 3), nullptr);
  const auto nameless = sampled(2, {{{0x41}}, {{1}}});
  EXPECT_EQ(HwReportStateGetNameForIndex(nameless.get(), 0), nullptr);
  EXPECT_FALSE(nameless->contains("StateNames"));
  states->set("StateNames", text("x"));
  EXPECT_EQ(HwReportStateGetNameForIndex(states.get(), 0), nullptr);
}

TEST(Values, Histograms) {
  const auto one =
      sampled(3, {{{0, 1, 2, 3}}, {{5, 11, 19, 70}}, {{1, 21, 22, 43}}, {{0, 4, 5, 6}}});
  EXPECT_EQ(HwReportHistogramGetBucketCount(one.get()), 4);
  EXPECT_EQ(HwReportHistogramGetBucketHits(one.get(), 1), 5u);
  EXPECT_EQ(HwReportHistogramGetBucketSum(one.get(), 2), 43);
  EXPECT_EQ(HwReportHistogramGetMinValue(one.get()), 11);
  EXPECT_EQ(HwReportHistogramGetMaxValue(one.get()), 22);
  EXPECT_EQ(HwReportHistogramGetMinValue(sampled(3, {{{0, 1, 2, 3}}}).get()), kInvalidSigned);
}

struct Segment {
  std::uint32_t base, geometric, buckets;
};

KvRef<KvData> configuration(const std::vector<Segment>& segments) {
  std::vector<std::uint32_t> words;
  for (const Segment& s : segments) words.insert(words.end(), {s.base, s.geometric, 99, s.buckets});
  return KvData::create(std::as_bytes(std::span(words)));
}

TEST(BucketBounds, Configurations) {
  constexpr auto kMinusOne = static_cast<std::uint32_t>(-1);
  const struct {
    const char* what;
    std::size_t buckets;
    KvRef<KvObject> config;
    std::vector<std::int64_t> bounds;  // empty: failure
  } cases[] = {
      {"linear", 4, configuration({{10, 0, 4}}), {10, 20, 30, 40}},
      {"linear, then geometric", 4, configuration({{5, 0, 2}, {20, 7, 2}}), {5, 10, 20, 400}},
      {"the second segment does not rise", 4, configuration({{10, 0, 2}, {20, 0, 1}}), {}},
      {"fewer than buckets", 4, configuration({{10, 0, 2}}), {10, 20}},
      {"a segment of none and of less",
       2,
       configuration({{7, 0, 0}, {7, 0, kMinusOne}, {10, 0, 2}}),
       {10, 20}},
      {"a product past 32 bits does not rise", 4, configuration({{0x80000000, 0, 2}}), {}},
      {"a power past 64 bits does not rise", 65'535, configuration({{0x10000, 1, 65'535}}), {}},
      {"too short", 2, KvData::create(std::vector<std::byte>(15, std::byte{1})), {}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    const auto one = channel(1, typeWord(3, c.buckets));
    one->set("HwReportChannelInfo", KvDictionary::create({{"HwReportChannelConfig", c.config}}));
    std::int64_t lower = -1, upper = 0;
    const auto boundsOf = [&](std::size_t bucket) {
      return HwReportHistogramGetBucketBounds(one.get(), static_cast<std::int32_t>(bucket), &lower,
                                              &upper);
    };
    for (std::size_t i = 0; i < c.bounds.size(); ++i) {
      EXPECT_EQ(boundsOf(i), 0u);
      EXPECT_EQ(std::pair(lower, upper), std::pair(i == 0 ? 0 : c.bounds[i - 1], c.bounds[i]));
    }
    EXPECT_EQ(boundsOf(c.bounds.size()), HwErrGeneral);
    EXPECT_EQ(boundsOf(static_cast<std::size_t>(-1)), HwErrGeneral);
    // Once made, the bounds stay, whatever the configuration says.
    one->remove("HwReportChannelInfo");
    EXPECT_EQ(boundsOf(0), c.bounds.empty() ? HwErrGeneral : 0u);
  }
}

TEST(Scaling, Units) {
  constexpr std::uint64_t kSecond = 1ull << 56, kData = 9ull << 56;
  const auto decimal = [](std::uint64_t byte) { return byte << 32; };
  const auto binary = [](std::uint64_t byte) { return byte << 40; };
  const double huge = static_cast<double>(UINT64_MAX);
  const struct {
    std::uint64_t value, from, to;
    double result;
  } cases[] = {
      {1500, kSecond | decimal(124), kSecond, 1.5},
      {24'000'000, kSecond | decimal(121) | 0x80000018, kSecond, 1},  // 1/24 of a microsecond
      {1, kData | binary(0x8C), kData | binary(0x82), 1024},          // a kibibyte in bytes
      {1, kData | binary(0x8C) | 4, kData | binary(0x8C), 4},
      {1, kData | binary(127 + 64), kData, huge},  // saturates
      {1, kData | decimal(0xFE) | binary(0xFE) | 7, kData, huge},
      {1, kData, kData | binary(0xFE), 1 / huge},
      {1, kData | binary(0xFF), kData, 1 / huge},         // wraps to -128
      {1, kData | decimal(127), kData | binary(127), 1},  // exponent 0
  };
  for (const auto& c : cases) {
    EXPECT_EQ(HwReportScaleValue(c.value, c.from, c.to), c.result)
        << std::hex << c.from << " " << c.to;
  }
  EXPECT_TRUE(std::isnan(HwReportScaleValue(3, kSecond, kData)));
  EXPECT_TRUE(std::isnan(HwReportScaleValue(3, kSecond | 1ull << 48, kSecond)));
}

}  // namespace
}  // namespace tally
