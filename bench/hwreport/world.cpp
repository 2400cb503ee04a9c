#include "hwreport/world.h"

#include <algorithm>
#include <cstring>
#include <random>

#include "hwreport/channels/raw_element.h"

namespace tally::bench {
namespace {

struct Format {
  const char* group;
  std::uint8_t code;
  std::uint16_t elements;
  std::size_t share;  // of ten channels
};
constexpr Format kFormats[] = {{"Counters", kHwReportFormatSimple, 1, 4},
                               {"States", kHwReportFormatState, 6, 2},
                               {"Histograms", kHwReportFormatHistogram, 10, 2},
                               {"Arrays", kHwReportFormatSimpleArray, 3, 2}};

KvRef<KvDictionary> information(const Format& format) {
  auto info = KvDictionary::create({{"HwReportChannelUnit", KvNumber::uint64(1ull << 56)}});
  if (format.code == kHwReportFormatHistogram) {
    const std::uint32_t record[] = {100, 0, 0, format.elements};
    info->set("HwReportChannelConfig", KvData::create(std::as_bytes(std::span(record))));
  }
  return info;
}

}  // namespace

ChannelWorld::ChannelWorld(std::size_t channels) {
  for (std::size_t number = 0; channels_.size() < channels; ++number) {
    addDriver(number, std::min(kChannelsPerDriver, channels - channels_.size()));
  }
  layOut();
}

void ChannelWorld::addDriver(std::size_t number, std::size_t channels) {
  auto legend = KvArray::create();
  std::uint64_t channelID = 1;
  for (const Format& format : kFormats) {
    auto list = KvArray::create();
    for (std::size_t i = 0; i < channels * format.share / 10; ++i, ++channelID) {
      const std::uint64_t category = channelID % 2 == 0 ? 0x100 : 0x200;
      const std::uint64_t type =
          format.code | category << 16 | std::uint64_t{format.elements} << 32;
      list->append(KvArray::create(
          {KvNumber::int64(static_cast<std::int64_t>(channelID)),
           KvNumber::int64(static_cast<std::int64_t>(type)),
           KvString::create(std::string(format.group) + " channel " + std::to_string(channelID))}));
      channels_.push_back({0x1000 + number, channelID, type});
    }
    legend->append(KvDictionary::create({{"HwReportGroupName", KvString::create(format.group)},
                                         {"HwReportSubGroupName", KvString::create("Benchmark")},
                                         {"HwReportChannelInfo", information(format)},
                                         {"HwReportChannels", list}}));
  }
  legends_.push_back(std::move(legend));
}

void ChannelWorld::layOut() {
  std::vector<Channel> order = channels_;
  std::shuffle(order.begin(), order.end(), std::mt19937_64(7));
  for (const Channel& channel : order) {
    for (std::size_t i = 0; i < TypeWord{channel.typeWord}.elementCount(); ++i) {
      const std::uint64_t words[] = {channel.driverID, channel.channelID,
                                     channel.typeWord, i + 1,
                                     10 + i,           20 + i,
                                     30 + i,           40 + i};
      const auto bytes = std::as_bytes(std::span(words));
      region_.insert(region_.end(), bytes.begin(), bytes.end());
    }
  }
}

RegistryHandle ChannelWorld::RegistryIteratorNext(RegistryHandle) {
  return next_ < legends_.size() ? kFirstDriver + static_cast<RegistryHandle>(next_++) : 0;
}

KvRef<KvObject> ChannelWorld::RegistryCopyProperty(RegistryHandle entry, std::string_view key) {
  if (key == "HwReportLegend") return legends_[entry - kFirstDriver];
  return KvBoolean::of(true);
}

RegistryResult ChannelWorld::RegistryGetEntryID(RegistryHandle entry, std::uint64_t* id) {
  *id = 0x1000 + (entry - kFirstDriver);
  return 0;
}

RegistryResult ChannelWorld::RegistryGetName(RegistryHandle entry, std::string* name) {
  *name = "bench-driver-" + std::to_string(entry - kFirstDriver);
  return 0;
}

RegistryResult ChannelWorld::ConnectionCallMethod(ConnectionHandle, std::uint32_t selector,
                                                  MethodCall& call) {
  if (selector == 2) {
    call.scalarOutput[0] = 7;
    call.scalarOutputCount = 1;
  }
  return 0;
}

}  // namespace tally::bench
