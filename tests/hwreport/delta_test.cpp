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
  const auto unsampled = channel(0x41, typeWord(2, 1));
  const struct {
    const char* what;
    KvRef<KvDictionary> earlier, later;
    std::string error;
    const char* collection = nullptr;  // the difference in a collection
    const char* single = collection;   // that of the channels themselves
  } cases[] = {
      {"simple", sampled(1, {{{10, 5, 6, 7}}}), sampled(1, {{{7, 8, 9, 1}}}), "", "-3 ! ! ! | ",
       "-3 5 6 7 | "},
      {"simple wraps", sampled(1, {{{kInvalid - 1}}}), sampled(1, {{{1}}}), "",
       "-9223372036854775806 ! ! ! | ", "-9223372036854775806 0 0 0 | "},
      {"simple, invalid before", sampled(1, {{{kInvalid}}}), sampled(1, {{{1}}}),
       "E00002BC " + none},
      {"simple, invalid after", sampled(1, {{{1}}}), sampled(1, {{{kInvalid}}}),
       "E00002BC " + none},
      {"simple, two elements", sampled(1, {{{1}}, {{2}}}), sampled(1, {{{1}}, {{2}}}),
       "E00002BC " + none},
      {"states", sampled(2, {{{1, 10, 100, 7}}, {{2, 20, 200, 8}}}),
       sampled(2, {{{1, 11, 150, 9}}, {{2, 20, 190, 6}}}), "", "1 1 50 9 | 2 0 -10 6 | "},
      {"states, invalid", sampled(2, {{{1, 10, kInvalid}}}), sampled(2, {{{1, 11, 150}}}), one},
      {"states, invalid after", sampled(2, {{{1, 10, 1}}}), sampled(2, {{{1, kInvalid, 150}}}),
       one},
      {"states, legend disagrees", sampled(2, {{{1, 1, 1}}}, 2), sampled(2, {{{1, 1, 1}}}, 2), one},
      {"states, counts differ", sampled(2, {{{1, 1, 1}}}, 1),
       sampled(2, {{{1, 1, 1}}, {{2, 1, 1}}}, 1), one},
      {"states, not sampled", unsampled, unsampled, one},
      {"histogram", sampled(3, {{{5, 1, 9, 50}}, {{0, 1, 9, 70}}, {{4, 1, 9, 40}}}),
       sampled(3, {{{7, 0, 10, 75}}, {{3, 2, 8, 30}}, {{4, 1, 9, 40}}}), "",
       "2 0 10 25 | 3 2 8 30 | 0 1 9 ! | "},
      {"histogram, invalid hits", sampled(3, {{{kInvalid}}}), sampled(3, {{{1}}}), one},
      {"histogram, invalid sum is subtracted", sampled(3, {{{1, 0, 0, kInvalid}}}),
       sampled(3, {{{2, 0, 0, 5}}}), "", "1 0 0 -9223372036854775803 | "},
      {"array", sampled(4, {{{1, kInvalid, 3, kInvalid}}}),
       sampled(4, {{{5, 6, kInvalid, kInvalid}}}), "", "4 6 3 ! | "},
      {"array, legend does not matter", sampled(4, {{{1}}}, 9), sampled(4, {{{5}}}, 9), "",
       "4 0 0 0 | "},
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
      {"same driver", drivers("D"), drivers("D"), true},
      {"another driver", drivers("E"), drivers("D"), false},
      {"no driver level", flat({one}), drivers("D"), false},
      {"no channels at the level", level({}), flat({one}), false},
      {"earlier channels are no array", level({{"HwReportChannels", text("x")}}), flat({one}),
       false},
      {"earlier drivers are no dictionary", level({{"HwReportDrivers", text("x")}}), drivers("D"),
       false},
      {"earlier has more levels", drivers("D"), level({}), true},
      {"counterpart is no dictionary", flat({text("x")}), flat({one}), false},
      {"counterpart has no type", flat({channel(0x41, kInvalid)}), flat({one}), false},
      {"later has no type", flat({one}), flat({channel(0x41, kInvalid)}), false},
      {"later without a counterpart", flat({}), flat({one}), true},
  };
  for (const auto& c : cases) {
    KvRef<HwReportError> error;
    EXPECT_EQ(!!HwReportCreateSamplesDelta(c.earlier.get(), c.later.get(), &error), c.works)
        << c.what;
    EXPECT_EQ(errorText(error), c.works ? "" : "E00002BC " + std::string(kNoReason)) << c.what;
  }
}

// The pairing rule as it is told, with a scan for each channel: the value that each later channel's
// counterpart has, 0 for none; empty on failure.
std::optional<std::vector<std::uint64_t>> naivePairs(const KvArray& earlier, const KvArray& later) {
  std::vector<std::uint64_t> values;
  std::optional<std::size_t> cursor;
  const auto typeOf = [](const KvDictionary* one) {
    return static_cast<std::uint64_t>(
        one->getAs<KvArray>("LegendChannel")->getAs<KvNumber>(1)->asInt64());
  };
  for (std::size_t i = 0; i < later.size(); ++i) {
    const auto* const wanted = later.getAs<KvDictionary>(i);
    values.push_back(0);
    if (i >= earlier.size()) continue;
    const auto equal = [&](const KvDictionary* one) {
      return HwReportChannelGetChannelID(one) == HwReportChannelGetChannelID(wanted) &&
             typeOf(one) == typeOf(wanted);
    };
    const auto* const same = earlier.getAs<KvDictionary>(i);
    if (same == nullptr) return std::nullopt;
    if (HwReportChannelGetDriverID(same) != HwReportChannelGetDriverID(wanted)) continue;
    if (equal(same)) {
      values.back() = slotOf(*same, 0, 0);
      continue;
    }
    for (std::size_t j = cursor.value_or(i + 1); j < earlier.size(); ++j) {
      const auto* const candidate = earlier.getAs<KvDictionary>(j);
      if (candidate == nullptr) return std::nullopt;
      if (!equal(candidate)) continue;
      values.back() = slotOf(*candidate, 0, 0);
      cursor = j + 1;
      break;
    }
  }
  return values;
}

TEST(Delta, PairingAgreesWithTheRuleOnRandomCollections) {
  Random random(5);
  std::size_t failures = 0, searched = 0;
  for (int round = 0; round < 4000; ++round) {
    const unsigned ids = 1 + random() % 12;
    const auto make = [&](unsigned count, bool malformed) {
      auto channels = KvArray::create();
      for (unsigned i = 0; i < count; ++i) {
        const std::uint64_t id = random() % 3 == 0 ? random() % ids : i % ids;
        const std::uint64_t type = typeWord(4, 1, random() % 8 == 0);
        const std::uint64_t driver = random() % 10 == 0;
        auto one = channel(id, type, nullptr, nullptr, nullptr, driver);
        one->set("RawElements", KvData::create(run(id, type, {{{1000 + i}}}, driver)));
        if (malformed && random() % 60 == 0) {
          channels->append(text("x"));
        } else {
          channels->append(one);
        }
      }
      return channels;
    };
    const auto earlier = make(random() % 30, true), later = make(random() % 30, false);
    const auto expected = naivePairs(*earlier, *later);
    const auto delta =
        HwReportCreateSamplesDelta(KvDictionary::create({{"HwReportChannels", earlier}}).get(),
                                   KvDictionary::create({{"HwReportChannels", later}}).get());
    ASSERT_EQ(!delta, !expected) << round;
    failures += !expected;
    if (!expected) continue;
    const auto* const result = delta->getAs<KvArray>("HwReportChannels");
    ASSERT_EQ(result->size(), later->size());
    for (std::size_t i = 0; i < later->size(); ++i) {
      ASSERT_EQ(slotOf(*result->getAs<KvDictionary>(i), 0, 0), 1000 + i - (*expected)[i]) << round;
      searched += (*expected)[i] != 0 && (*expected)[i] != 1000 + i;
    }
  }
  EXPECT_GT(failures, 300u);
  EXPECT_GT(searched, 1000u);
}

}  // namespace
}  // namespace tally
