// Legends of drivers: channel collections out of them, however they are asked for.
#include "channel_checks.h"
#include "fakes/fake_registry.h"
#include "fuzz_values.h"
#include "platform/platform.h"

using namespace tally;
using fuzz::require;

namespace {

// The properties of each driver, from one value for all of them.
std::shared_ptr<fakes::FakeRegistry> registryOf(const KvDictionary& described) {
  auto registry = std::make_shared<fakes::FakeRegistry>();
  const auto add = [&](KvDictionary* properties) {
    const std::size_t number = registry->entries.size();
    registry->entries.push_back({"Driver", "Driver" + std::to_string(number), 0x10 + number,
                                 KvRef<KvDictionary>::share(properties)});
  };
  if (const auto* entries = described.getAs<KvArray>("Entries")) {
    for (const auto& entry : *entries) {
      if (auto* const properties = kvCast<KvDictionary>(entry.get())) add(properties);
    }
  }
  return registry;
}

}  // namespace

FUZZ_TARGET(legends)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const bool text = fuzz::isDocument(input.rest());
  const std::int32_t options = text ? kHwReportByGroup : input.take<std::int8_t>();
  const auto value = fuzz::valueOf(input);
  const auto* const described = kvCast<KvDictionary>(value.get());
  if (described == nullptr) return 0;

  Platform services;
  const auto registry = registryOf(*described);
  services.deviceRegistry = registry;
  {
    const PlatformScope scope(services);
    const auto all = HwReportCopyAllChannels(options);
    if (!all) return 0;
    const std::int32_t count = HwReportGetChannelCount(all.get());
    require(count >= 0, "what was made can be walked");
    std::int32_t visited = 0;
    HwReportIterate(all.get(), [&](KvDictionary* channel) {
      ++visited;
      fuzz::askChannel(channel);
      return HwIterContinue;
    });
    require(visited == count, "every channel is visited");

    const auto simple = HwReportCopyChannelsOfFormat(kHwReportFormatSimple, options);
    HwReportCopyChannelsInCategories(1, options);
    const auto merged = HwReportCreateAggregate(kHwReportByDriver);
    HwReportMergeChannels(merged.get(), all.get());
    require(HwReportGetChannelCount(merged.get()) == count, "no channel is lost in a merge");
    require(!simple || HwReportGetChannelCount(simple.get()) <= count, "a choice is no larger");
    const auto group = KvString::create("");
    HwReportSelectChannelsInGroup(merged.get(), group.get(), nullptr);

    // A collection made elsewhere may contain anything.
    const auto foreign = described->copy();
    HwReportIterate(foreign.get(), [](KvDictionary* channel) {
      fuzz::askChannel(channel, fuzz::Maker::Anybody);
      return HwIterContinue;
    });
    const auto target = HwReportCreateAggregate(options);
    HwReportMergeChannels(target.get(), foreign.get());
  }
  require(registry->openHandles() == 0, "every handle is released");
  return 0;
}
