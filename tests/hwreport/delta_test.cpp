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
  const std::string none = kNoReason, one = "00000001 " + none, bad = "E00002C2 ";
  const struct {
    KvRef<KvDictionary> earlier, later;
    std::string error;
    const char* collection = "";      // the difference in a collection
    const char* single = collection;  // that of the channels themselves
  } cases[] = {
      // Simple ones.
      {sampled(1, {{{10, 5, 6, 7}}}), sampled(1, {{{7, 8, 9, 1}}}), "", "-3 ! ! ! | ",
       "-3 5 6 7 | "},
      {sampled(1, {{{kInvalid}}}), sampled(1, {{{1}}}), "E00002BC " + none},
      // States; then with an invalid one, with a legend that disagrees, and of other counts.
      {sampled(2, {{{1, 10, 100, 7}}, {{2, 20, 200, 8}}}),
       sampled(2, {{{1, 11, 150, 9}}, {{2, 20, 190, 6}}}), "", "1 1 50 9 | 2 0 -10 6 | "},
      {sampled(2, {{{1, 10, kInvalid}}}), sampled(2, {{{1, 11, 150}}}), one},
      {sampled(2, {{{1, 1, 1}}}, 2), sampled(2, {{{1, 1, 1}}}, 2), one},
      {sampled(2, {{{1, 1, 1}}}, 1), sampled(2, {{{1, 1, 1}}, {{2, 1, 1}}}, 1), one},
      // Histograms: an invalid sum is subtracted all the same.
      {sampled(3, {{{5, 1, 9, 50}}, {{0, 1, 9, 70}}, {{4, 1, 9, 40}}}),
       sampled(3, {{{7, 0, 10, 75}}, {{3, 2, 8, 30}}, {{4, 1, 9, 40}}}), "",
       "2 0 10 25 | 3 2 8 30 | 0 1 9 ! | "},
      {sampled(3, {{{1, 0, 0, kInvalid}}}), sampled(3, {{{2, 0, 0, 5}}}), "",
       "1 0 0 -9223372036854775803 | "},
      // Arrays; then of other counts.
      {sampled(4, {{{1, kInvalid, 3, kInvalid}}}), sampled(4, {{{5, 6, kInvalid, kInvalid}}}), "",
       "4 6 3 ! | "},
      {sampled(4, {{{1}}}, 2), sampled(4, {{{1}}, {{2}}}, 2), one},
      // No format, and an unknown one.
      {sampled(0, {{{1}}}), sampled(0, {{{1}}}), bad + none},
      {sampled(5, {{{1}}}), sampled(5, {{{1}}}), "E00002E6 unknown report format"},
  };
  KvRef<HwReportError> error;
  for (const auto& c : cases) {
    SCOPED_TRACE(&c - cases);
    error = nullptr;
    const std::string before = slotsOf(*c.earlier) + slotsOf(*c.later);
    const auto delta =
        HwReportCreateSamplesDelta(flat({c.earlier}).get(), flat({c.later}).get(), &error);
    EXPECT_EQ(errorText(error), c.error);
    EXPECT_EQ(delta ? slotsOf(*channelAt(delta, 0)) : "", c.collection);
    error = nullptr;
    const auto single = HwReportSampleCreateDelta(c.earlier.get(), c.later.get(), &error);
    EXPECT_EQ(errorText(error), c.error);
    EXPECT_EQ(single ? slotsOf(*single) : "", c.single);
    EXPECT_EQ(slotsOf(*c.earlier) + slotsOf(*c.later), before);
  }
  const auto wrapped =
      flat({sampled(1, std::vector<Element>(65537, {{3}, 111}), 1)});  // a 16-bit count of 1
  const auto later = flat({sampled(1, std::vector<Element>(65537, {{3}, 222}), 1)});
  const auto delta = HwReportCreateSamplesDelta(wrapped.get(), later.get());
  EXPECT_EQ(slotOf(*channelAt(delta, 0), 0, 0), 0u);
  EXPECT_EQ(slotOf(*channelAt(delta, 0), 65536, 0), kInvalid);
  EXPECT_EQ(
      naive::readAt<std::uint64_t>(channelAt(delta, 0)->getAs<KvData>("RawElements")->bytes(), 24),
      111u)
      << "the earlier time";
  const auto simple = sampled(1, {{{1}}});
  EXPECT_FALSE(HwReportSampleCreateDelta(simple.get(), sampled(4, {{{1}}}).get(), &error));
  EXPECT_EQ(errorText(error), bad + "mismatched formats");
  for (auto [a, b] : {std::pair{simple.get(), (KvDictionary*)nullptr}, {nullptr, simple.get()}}) {
    EXPECT_FALSE(HwReportSampleCreateDelta(a, b, &error));
    EXPECT_EQ(errorText(error), bad + none);
    EXPECT_FALSE(HwReportCreateSamplesDelta(a, b, &error));
    EXPECT_EQ(errorText(error), bad + none);
  }
}

TEST(Delta, LevelsMustFitEachOther) {
  const auto one = sampled(1, {{{1}}});
  const auto drivers = [&](const char* name) {
    return KvDictionary::create({{"HwReportDrivers", KvDictionary::create({{name, flat({one})}})}});
  };
  const std::pair<KvRef<KvDictionary>, KvRef<KvDictionary>> misfits[] = {
      {drivers("E"), drivers("D")},
      {flat({one}), drivers("D")},
      {KvDictionary::create({{"HwReportChannels", text("x")}}), flat({one})},
      {flat({text("x")}), flat({one})},
      {flat({channel(0x41, kInvalid)}), flat({one})},
  };
  for (const auto& [earlier, later] : misfits) {
    KvRef<HwReportError> error;
    EXPECT_FALSE(HwReportCreateSamplesDelta(earlier.get(), later.get(), &error));
    EXPECT_EQ(errorText(error), "E00002BC " + std::string(kNoReason))
        << &earlier - &misfits[0].first;
  }
  EXPECT_TRUE(HwReportCreateSamplesDelta(flat({}).get(), flat({one}).get())) << "no counterpart";
}

// A later channel is paired with the earlier one at its place if id and type agree, else with the
// next that was not taken by such a search; never with another driver's, nor past the earlier ones.
TEST(Delta, PairsByPlaceAndThenByASearchForward) {
  using Words = std::vector<std::uint64_t>;
  const auto counted = [](const Words& ids, std::uint64_t base, std::uint64_t driver) {
    auto channels = KvArray::create();
    for (std::size_t i = 0; i < ids.size(); ++i) {
      auto one = channel(ids[i], typeWord(1, 1), nullptr, nullptr, nullptr, driver);
      one->set("RawElements", KvData::create(run(ids[i], typeWord(1, 1), {{{base + i}}}, driver)));
      channels->append(one);
    }
    return KvDictionary::create({{"HwReportChannels", channels}});
  };
  const struct {
    Words earlier, later, paired;  // with the places of the earlier channels; 9: none
    std::uint64_t driver = 0x10;   // of the later ones
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
    for (std::size_t i = 0; i < c.later.size(); ++i) {
      const std::uint64_t former = 100 + i - slotOf(*channelAt(delta, i), 0, 0);
      EXPECT_EQ(former == 0 ? 9 : former - 1, c.paired[i]) << testing::PrintToString(c.later);
    }
  }
}

}  // namespace
}  // namespace tally
