// Subscribing and sampling.
#include "hwreport/channel_world.h"

namespace tally {
namespace {

using namespace tests;

class Samples : public RegistryTest {
 protected:
  void addHub() { registry().entries.push_back({"HwReportHub", "hub", 1}); }
  KvRef<HwReportSubscription> subscribe(KvDictionary* desired) {
    return HwReportCreateSubscription(nullptr, desired, &subscribed_, 0, &error_);
  }
  KvRef<HwReportError> error_;
  KvRef<KvDictionary> subscribed_;
};

TEST_F(Samples, SubscribingFailsStepByStep) {
  const auto good = flat({channel(1, 1, "a")});
  const auto driverless = channel(2, 1, "b");
  driverless->remove("DriverID");
  const std::string refused = "E00002BD createInterestList() failed";
  using Fault = void (*)(fakes::FakeRegistry&);
  const struct {
    KvRef<KvDictionary> desired;
    std::string error;
    std::size_t calls = 0;  // how many of them, before the connection is closed
    Fault fault = nullptr;
  } cases[] = {
      {nullptr, "E00002C2 bad arguments"},
      {flat({text("x"), driverless}), "E00002C2 iteration error"},
      {HwReportCreateAggregate(0), "E00002C2 no channels"},
      {flat({channel(1, 1), driverless}), refused},
      {flat({channel(1, kInvalid)}), refused},
      {good, "E00002F0 " + std::string(kNoReason), 0, [](auto& r) { r.entries.clear(); }},
      {good, "000000E1 Could not open HwReportHub", 1, [](auto& r) { r.openResult = 0xE1; }},
      {good, "000000E2 kHwReportUserClientOpen failed", 2,
       [](auto& r) { r.callResults[0] = 0xE2; }},
      {good, "000000E3 kHwReportUserClientConfigureInterests failed", 3,
       [](auto& r) { r.callResults[2] = 0xE3; }},
      {good, "E00002BC kHwReportUserClientConfigureInterests failed", 3,
       [](auto& r) { r.tokensWritten = 0; }},
      {good, "000000E4 HwConnectMapMemory() failed", 4, [](auto& r) { r.mapResult = 0xE4; }},
      {good, "", 5},
  };
  for (const auto& c : cases) {
    registry() = fakes::FakeRegistry();
    addHub();
    registry().region.resize(64);
    if (c.fault) c.fault(registry());
    error_ = nullptr;
    subscribed_ = nullptr;
    SCOPED_TRACE(&c - cases);
    EXPECT_EQ(!subscribe(c.desired.get()), !c.error.empty());  // and releases it
    EXPECT_EQ(errorText(error_), c.error);
    EXPECT_EQ(!subscribed_, !c.error.empty());
    std::vector<std::string> calls = {"open 0", "call 0", "call 2", "map 7 1", "unmap 7"};
    calls.resize(c.calls);
    if (c.calls > 1) calls.emplace_back("close");  // what did not open is not closed
    EXPECT_EQ(registry().calls, calls);
    EXPECT_EQ(registry().openHandles(), 0);
  }
  EXPECT_FALSE(HwReportCreateSubscription(nullptr, good.get(), nullptr, 0, &error_));
  EXPECT_EQ(errorText(error_), "E00002C2 bad arguments");
}

TEST_F(Samples, TheHubGetsTheInterestsAndTheSampleItsElements) {
  addHub();
  const auto desired = flat({channel(0x41, typeWord(1, 1), "a"), channel(0x42, 0, "b")});
  const auto type = typeWord(4, 2, 0x100);
  registry().region =
      run(0x42, type, {{{1, 2, 3, 4}}, {{5, 6, 7, 8}}}) + run(0x41, typeWord(1, 1), {{{9}}});
  const auto subscription = subscribe(desired.get());
  const std::uint64_t interests[] = {2, 0x10, 0x41, typeWord(1, 1), 0x10, 0x42, 0};
  ASSERT_EQ(registry().structure.size(), sizeof(interests));
  EXPECT_EQ(std::memcmp(registry().structure.data(), interests, sizeof(interests)), 0);
  EXPECT_NE(channelAt(subscribed_, 0), channelAt(desired, 0)) << "a copy";

  const auto samples = HwReportCreateSamples(subscription.get(), subscribed_.get());
  EXPECT_EQ(registry().scalars, std::vector<std::uint64_t>{0x1'0000'0007}) << "the whole token";
  EXPECT_EQ(HwReportArrayGetValueAtIndex(channelAt(samples, 1), 6), 7);
  // The channel without a format has learnt it, in every copy of it.
  EXPECT_EQ(HwReportChannelGetFormat(channelAt(desired, 1)), 4);
  EXPECT_EQ(HwReportChannelGetCategories(channelAt(samples, 1)), 0x100);
  // A sample is its own.
  registry().region[32 + 128] = std::byte{99};
  EXPECT_EQ(slotOf(*channelAt(samples, 0), 0, 0), 9u);

  registry().callResults[3] = 0xE5;
  EXPECT_FALSE(HwReportCreateSamples(subscription.get(), subscribed_.get(), &error_));
  EXPECT_EQ(errorText(error_), "000000E5 " + std::string(kNoReason));
  EXPECT_FALSE(HwReportCreateSamples(nullptr, subscribed_.get(), &error_));
  EXPECT_EQ(errorText(error_), "E00002C2 " + std::string(kNoReason));
}

TEST_F(Samples, WhatASampleLearnsStaysOutOfTheLegend) {
  // Others may be reading the driver's legend, which is one object for all.
  const auto line = KvArray::create({number(0x41), number(0)});
  addDriver("D", 0x10, KvArray::create({flat({line})}));
  const auto channels = HwReportCopyAllChannels(0);
  const auto raw = KvData::create(run(0x41, typeWord(1, 1), {{{9}}}));
  const auto samples = HwReportCreateSamplesRaw(channels.get(), raw.get());
  EXPECT_EQ(HwReportSimpleGetIntegerValue(channelAt(samples, 0)), 9);
  EXPECT_EQ(HwReportChannelGetFormat(channelAt(channels, 0)), 1);
  EXPECT_EQ(line->getAs<KvNumber>(1)->asInt64(), 0);
}

TEST(SamplesRaw, BuffersOfEveryShape) {
  const auto wanted = flat({channel(1, typeWord(1, 1), "a"), channel(2, typeWord(1, 1), "b")});
  const auto one = run(1, typeWord(1, 1), {{{10}}}), two = run(2, typeWord(1, 1), {{{20}}});
  const auto again = run(1, typeWord(1, 1), {{{11}}}), zero = run(3, typeWord(1, 0), {{{}}});
  const auto lies = run(2, typeWord(1, 3), {{{21}, {}}, {{22}, {}}});
  const std::string failed = "E00002BC couldn't create samples";
  const struct {
    const char* what;
    std::vector<std::byte> buffer;
    std::string names, error = {};
  } cases[] = {
      {"both, in another order", two + one, "a b"},
      {"the first of two runs counts", one + again + two, "a b"},
      {"one is missing", one, "a"},
      {"63 bytes are none", std::vector<std::byte>(63), "", "E00002C2 couldn't create samples"},
      {"a zero count before one of them", one + zero + two, "", failed},
      {"a zero count after all of them", one + two + zero, "a b"},
      {"a run longer than the rest", one + lies, "a"},
  };
  for (const auto& c : cases) {
    KvRef<HwReportError> error;
    const auto samples =
        HwReportCreateSamplesRaw(wanted.get(), KvData::create(c.buffer).get(), &error);
    EXPECT_EQ(errorText(error), c.error) << c.what;
    ASSERT_EQ(!samples, !c.error.empty()) << c.what;
    EXPECT_EQ(namesOf(samples.get()), c.names) << c.what;
    if (samples) {
      EXPECT_EQ(slotOf(*channelAt(samples, 0), 0, 0), 10u) << c.what;
    }
  }
  KvRef<HwReportError> error;
  EXPECT_FALSE(HwReportCreateSamplesRaw(nullptr, KvData::create(one).get(), &error));
  EXPECT_EQ(errorText(error), "E00002C2 couldn't create samples");
  EXPECT_FALSE(HwReportCreateSamplesRaw(wanted.get(), nullptr, &error));
  EXPECT_FALSE(
      HwReportCreateSamplesRaw(flat({text("x")}).get(), KvData::create(one).get(), &error));
  EXPECT_EQ(errorText(error), failed);
}

}  // namespace
}  // namespace tally
