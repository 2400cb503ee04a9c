// Samples whose channels are rows still, beside the same as plain dictionaries.
#include <algorithm>
#include <numeric>
#include <random>

#include "hwreport/channel_world.h"
#include "hwreport/naive_samples.h"

namespace tally {
namespace {

using namespace tests;

// Copies that were looked at, so that none of them is a row.
KvRef<KvDictionary> plain(const KvRef<KvDictionary>& collection) {
  auto channels = KvArray::create();
  for (const auto& one : *collection->getAs<KvArray>("HwReportChannels")) {
    channels->append(static_cast<const KvDictionary&>(*one).copy());
  }
  return KvDictionary::create({{"HwReportChannels", channels}});
}

class Rows : public RegistryTest {};

TEST_F(Rows, AreWhatDictionariesWouldBe) {
  std::mt19937_64 random(5);
  const auto one = [&](std::uint64_t below) { return random() % below; };
  const auto wanted = flat({});
  auto* const channels = wanted->getAs<KvArray>("HwReportChannels");
  std::vector<std::uint64_t> types;
  for (std::uint64_t id = 0; id < 60; ++id) {
    types.push_back(id % 20 == 7 ? 0 : typeWord(1 + id % 4, id % 4 == 0 ? 1 : 1 + one(4)));
    const auto driver = 0x10 + id / 30;
    channels->append(channel(id, types.back(), id % 3 == 0 ? nullptr : "n", "G", nullptr, driver));
    if (id % 25 == 3) channels->append(channel(id, types.back(), "twice", "G", nullptr, driver));
  }
  std::vector<std::uint64_t> order(60);
  std::iota(order.begin(), order.end(), 0);
  registry().entries.push_back({"HwReportHub", "hub", 1});
  registry().region.resize(64);
  KvRef<KvDictionary> subscribed;
  ASSERT_TRUE(HwReportCreateSubscription(nullptr, wanted.get(), &subscribed, 0));
  KvRef<KvDictionary> earlier, earlierPlain;
  for (int round = 0; round < 60; ++round) {
    if (round % 10 == 0) std::shuffle(order.begin(), order.end(), random);  // mostly they stay
    std::vector<std::byte> buffer;
    for (const auto id : order) {
      if (round % 7 == 3 && one(20) == 0) continue;  // is not served
      const std::uint64_t known = types[static_cast<std::size_t>(id)];
      const std::uint64_t type = known != 0 ? known : typeWord(4, 2);
      std::vector<Element> elements(static_cast<std::size_t>(type >> 32));
      for (auto& element : elements) element = {{one(9), one(9), one(9), one(9)}, one(50)};
      auto bytes = run(id, type, elements, 0x10 + id / 30);
      if (one(30) == 0) bytes[bytes.size() - 64 + 17] = std::byte{9};  // an id of its own
      buffer = buffer + bytes;
    }
    const auto raw = KvData::create(buffer);
    const auto later = HwReportCreateSamplesRaw(subscribed.get(), raw.get());
    // The rows of the one are never looked at, apart from their names; those of the other are.
    const auto made = HwReportCreateSamplesRaw(subscribed.get(), raw.get());
    const auto expected = naive::createSamples(*wanted, buffer);
    for (const auto& sample : {later, made, expected}) {
      if (round % 4 == 1) namesOf(sample.get());
    }
    EXPECT_TRUE(kvIdentical(made.get(), expected.get())) << round;
    const auto laterPlain = plain(made);
    if (earlier) {
      const auto delta = HwReportCreateSamplesDelta(earlier.get(), later.get());
      const auto same = HwReportCreateSamplesDelta(earlierPlain.get(), laterPlain.get());
      EXPECT_TRUE(delta || round > 50) << round;
      EXPECT_TRUE(delta ? kvIdentical(delta.get(), same.get()) : !same) << round;
    }
    earlier = later;
    earlierPlain = laterPlain;
    // Who changes an id in a legend means it.
    auto* const legend = channelAt(wanted, 5)->getAs<KvArray>("LegendChannel");
    if (round == 50) legend->replaceAt(0, number(order[0]));
  }
}

}  // namespace
}  // namespace tally
