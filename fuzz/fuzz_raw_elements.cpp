// Raw elements and bucket configurations: samples cut out of any buffer, their values, and their
// differences. A plain scan must cut the same.
#include "channel_checks.h"
#include "fuzz_values.h"
#include "hwreport/naive_samples.h"

using namespace tally;
using fuzz::require;

namespace {

// Channels whose ids a mutation hits, since few differ: of drivers 0 to 3 with channels 0 to 7.
KvRef<KvDictionary> takeChannels(fuzz::Input& input) {
  auto channels = KvArray::create();
  for (int left = input.take<std::uint8_t>() % 8; left > 0; --left) {
    const auto place = input.take<std::uint8_t>();
    const auto format = input.take<std::uint8_t>();
    const auto elements = input.take<std::uint8_t>();
    auto info = HwReportCreateUnitInfo(input.take<std::uint64_t>());
    info->set("HwReportChannelConfig", KvData::create(input.takeCopy(input.take<std::uint8_t>())));
    channels->append(KvDictionary::create(
        {{"DriverID", KvNumber::uint64(place % 4)},
         {"DriverName", KvString::create("D")},
         {"LegendChannel",
          KvArray::create({KvNumber::uint64(place / 4 % 8),
                           KvNumber::uint64(format % 6 | std::uint64_t{elements} << 32)})},
         {"HwReportChannelInfo", std::move(info)}}));
  }
  return KvDictionary::create({{"HwReportChannels", std::move(channels)}});
}

KvRef<KvDictionary> cut(KvDictionary* subscribed, const std::vector<std::byte>& buffer) {
  const auto raw = KvData::create(buffer);
  const auto samples = HwReportCreateSamplesRaw(subscribed, raw.get());
  if (buffer.size() < 64) {
    require(!samples, "less than an element gives no sample");
    return samples;
  }
  const auto expected = naive::createSamples(*subscribed, buffer);
  require(samples ? kvEqual(samples.get(), expected.get()) : !expected,
          "a plain scan cuts the same");
  return samples;
}

}  // namespace

FUZZ_TARGET(raw_elements)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto subscribed = takeChannels(input);
  const auto earlierBuffer = input.takeCopy(input.take<std::uint16_t>());
  const auto laterBuffer = input.takeRest();
  const auto earlier = cut(subscribed.get(), earlierBuffer);
  const auto later = cut(subscribed.get(), laterBuffer);
  for (const auto& samples : {earlier, later}) {
    if (!samples) continue;
    HwReportIterate(samples.get(), [](KvDictionary* channel) {
      fuzz::askChannel(channel);
      return HwIterContinue;
    });
  }
  if (!earlier || !later) return 0;
  if (const auto delta = HwReportCreateSamplesDelta(earlier.get(), later.get())) {
    require(HwReportGetChannelCount(delta.get()) == HwReportGetChannelCount(later.get()),
            "a difference has every later channel");
    HwReportIterate(delta.get(), [](KvDictionary* channel) {
      fuzz::askChannel(channel);
      return HwIterContinue;
    });
  }
  auto* const before = earlier->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(0);
  auto* const after = later->getAs<KvArray>("HwReportChannels")->getAs<KvDictionary>(0);
  HwReportSampleCreateDelta(before, after);
  return 0;
}
