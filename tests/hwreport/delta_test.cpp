// Differences of samples: formats, pairing, levels.
#include "hwreport/channel_world.h"
#include "hwreport/naive_samples.h"

namespace tally {
namespace {

using namespace tests;

// The value slots of a channel, element by element, "!" for the invalid marker.
std::string slotsOf(const KvDictionary& one) {
  const auto* data = one.getAs<KvData>("RawElements");
  std::string out;
  for (std::size_t i = 0; data != nullptr && i < data->bytes().size() / 64; ++i) {
    for (std::size_t slot = 0; slot < 4; ++slot) {
      const std::uint64_t value = slotOf(one, i, slot);
      out += value == kInvalid ? "! " : std::to_string(static_cast<std::int64_t>(value)) + " ";
    }
    out += "| ";
  }
  return out;
}

TEST(Delta, EveryFormatAndFailure) {
  const std::string none = kNoReason, one = "00000001 " + none;
  const struct {
    const char* what;
    KvRef<KvDictionary> earlier, later;
    std::string error;
    const char* collection = nullptr;  // the difference in a collection
    const char* single = collection;   // that of the channels themselves
  } cases[] = {
      {"simple", sampled(1, {{{10, 5, 6, 7}}}), sampled(1, {{{7, 8, 9, 1}}}), "", "-3 ! ! ! | ",
       "-3 5 6 7 | "},
      {"simple, invalid before", sampled(1, {{{kInvalid}}}), sampled(1, {{{1}}}),
       "E00002BC " + none},
      {"states", sampled(2, {{{1, 10, 100, 7}}, {{2, 20, 200, 8}}}),
       sampled(2, {{{1, 11, 150, 9}}, {{2, 20, 190, 6}}}), "", "1 1 50 9 | 2 0 -10 6 | "},
      {"states, invalid", sampled(2, {{{1, 10, kInvalid}}}), sampled(2, {{{1, 11, 150}}}), one},
      {"states, legend disagrees", sampled(2, {{{1, 1, 1}}}, 2), sampled(2, {{{1, 1, 1}}}, 2), one},
      {"states, counts differ", sampled(2, {{{1, 1, 1}}}, 1),
       sampled(2, {{{1, 1, 1}}, {{2, 1, 1}}}, 1), one},
      {"histogram", sampled(3, {{{5, 1, 9, 50}}, {{0, 1, 9, 70}}, {{4, 1, 9, 40}}}),
       sampled(3, {{{7, 0, 10, 75}}, {{3, 2, 8, 30}}, {{4, 1, 9, 40}}}), "",
       "2 0 10 25 | 3 2 8 30 | 0 1 9 ! | "},
      {"histogram, invalid sum is subtracted", sampled(3, {{{1, 0, 0, kInvalid}}}),
       sampled(3, {{{2, 0, 0, 5}}}), "", "1 0 0 -9223372036854775803 | "},
      {"array", sampled(4, {{{1, kInvalid, 3, kInvalid}}}),
       sampled(4, {{{5, 6, kInvalid, kInvalid}}}), "", "4 6 3 ! | "},
      {"array, counts differ", sampled(4, {{{1}}}, 2), sampled(4, {{{1}}, {{2}}}, 2), one},
      {"no format", sampled(0, {{{1}}}), sampled(0, {{{1}}}), "E00002C2 " + none},
      {"unknown format", sampled(5, {{{1}}}), sampled(5, {{{1}}}),
       "E00002E6 unknown report format"},
  };
  for (const auto& c : cases) {
    KvRef<HwReportError> error;
    const std::string before = slotsOf(*c.earlier) + slotsOf(*c.later);
    const auto delta =
        HwReportCreateSamplesDelta(flat({c.earlier}).get(), flat({c.later}).get(), &error);
    EXPECT_EQ(errorText(error), c.error) << c.what;
    ASSERT_EQ(!delta, c.collection == nullptr) << c.what;
    if (delta) {
      const auto* result = delta->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(0);
      EXPECT_EQ(slotsOf(*result), c.collection) << c.what;
    }
    error = nullptr;
    const auto single = HwReportSampleCreateDelta(c.earlier.get(), c.later.get(), &error);
    EXPECT_EQ(errorText(error), c.error) << c.what;
    ASSERT_EQ(!single, c.single == nullptr) << c.what;
    EXPECT_EQ(single ? slotsOf(*single) : "", c.single != nullptr ? c.single : "") << c.what;
    EXPECT_EQ(slotsOf(*c.earlier) + slotsOf(*c.later), before) << c.what;
  }
  KvRef<HwReportError> error;
  const auto wrapped = sampled(1, std::vector<Element>(65537, {{3}}), 1);  // a 16-bit count of 1
  const auto delta = HwReportCreateSamplesDelta(flat({wrapped}).get(), flat({wrapped}).get());
  const auto* last = delta->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(0);
  EXPECT_EQ(slotOf(*last, 0, 0), 0u);
  EXPECT_EQ(slotOf(*last, 65536, 0), kInvalid);
  EXPECT_FALSE(
      HwReportSampleCreateDelta(sampled(1, {{{1}}}).get(), sampled(4, {{{1}}}).get(), &error));
  EXPECT_EQ(errorText(error), "E00002C2 mismatched formats");
  const auto simple = sampled(1, {{{1}}});
  for (auto [a, b] : {std::pair{simple.get(), (KvDictionary*)nullptr}, {nullptr, simple.get()}}) {
    EXPECT_FALSE(HwReportSampleCreateDelta(a, b, &error));
    EXPECT_EQ(errorText(error), "E00002C2 " + none);
    EXPECT_FALSE(HwReportCreateSamplesDelta(a, b, &error));
    EXPECT_EQ(errorText(error), "E00002C2 " + none);
  }
}

TEST(Delta, IdentifyingFieldsOfASimpleChannelAreTheEarlierOnes) {
  auto earlier = sampled(1, {{{10}, 111}}), later = sampled(1, {{{12}, 222}});
  const auto delta = HwReportCreateSamplesDelta(flat({earlier}).get(), flat({later}).get());
  const auto* one = delta->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(0);
  EXPECT_EQ(naive::readAt<std::uint64_t>(one->getAs<KvData>("RawElements")->bytes(), 24), 111u);
}

TEST(Delta, LevelsMustFitEachOther) {
  const auto one = sampled(1, {{{1}}});
  const auto level = [&](Fields fields) { return KvDictionary::create(fields); };
  const auto drivers = [&](const char* name) {
    return level({{"HwReportDrivers", KvDictionary::create({{name, flat({one})}})}});
  };
  const struct {
    const char* what;
    KvRef<KvDictionary> earlier, later;
    bool works;
  } cases[] = {
      {"another driver", drivers("E"), drivers("D"), false},
      {"no driver level", flat({one}), drivers("D"), false},
      {"earlier channels are no array", level({{"HwReportChannels", text("x")}}), flat({one}),
       false},
      {"counterpart is no dictionary", flat({text("x")}), flat({one}), false},
      {"counterpart has no type", flat({channel(0x41, kInvalid)}), flat({one}), false},
      {"later without a counterpart", flat({}), flat({one}), true},
  };
  for (const auto& c : cases) {
    KvRef<HwReportError> error;
    EXPECT_EQ(!!HwReportCreateSamplesDelta(c.earlier.get(), c.later.get(), &error), c.works)
        << c.what;
    EXPECT_EQ(errorText(error), c.works ? "" : "E00002BC " + std::string(kNoReason)) << c.what;
  }
}

// A later channel is paired with the earlier one at its place if id and type agree, else with the
// next that was not taken by such a search; never with another driver's, nor past the earlier ones.
TEST(Delta, PairsByPlaceAndThenByASearchForward) {
  const auto counted = [](std::vector<std::uint64_t> ids, std::uint64_t base,
                          std::uint64_t driver) {
    auto channels = KvArray::create();
    for (std::size_t i = 0; i < ids.size(); ++i) {
      auto one = channel(ids[i], typeWord(1, 1), nullptr, nullptr, nullptr, driver);
      one->set("RawElements", KvData::create(run(ids[i], typeWord(1, 1), {{{base + i}}}, driver)));
      channels->append(one);
    }
    return KvDictionary::create({{"HwReportChannels", channels}});
  };
  const struct {
    std::vector<std::uint64_t> earlier, later;
    std::vector<std::uint64_t> paired;  // places of the earlier channels; 9: none
    std::uint64_t driver = 0x10;        // of the later ones
  } cases[] = {
      {{1, 2, 3}, {1, 2, 3}, {0, 1, 2}},
      {{1, 2, 3}, {2, 3, 3}, {1, 2, 2}},
      {{1, 2, 1, 2}, {2, 1, 2}, {1, 2, 3}},
      {{1, 2, 1}, {3, 1}, {9, 2}},
      {{1}, {1, 1}, {0, 9}},
      {{1, 2}, {1, 2}, {9, 9}, 0x11},
      {{5, 1, 1, 2}, {1, 2, 2, 1}, {1, 3, 9, 9}},
  };
  for (const auto& c : cases) {
    const auto delta = HwReportCreateSamplesDelta(counted(c.earlier, 1, 0x10).get(),
                                                  counted(c.later, 100, c.driver).get());
    ASSERT_TRUE(delta);
    std::vector<std::uint64_t> paired;
    for (std::size_t i = 0; i < c.later.size(); ++i) {
      const auto* one = delta->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(i);
      const std::uint64_t former = 100 + i - slotOf(*one, 0, 0);
      paired.push_back(former == 0 ? 9 : former - 1);
    }
    EXPECT_EQ(paired, c.paired) << testing::PrintToString(c.later);
  }
}

}  // namespace
}  // namespace tally
