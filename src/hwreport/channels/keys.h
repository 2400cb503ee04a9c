// The keys of channel dictionaries and collections. Each is one shared object, so that a channel
// costs no memory for its keys and a look-up compares pointers.
#pragma once

#include <string_view>

#include "kv/value.h"

namespace tally {

struct ChannelKeys {
  // A channel.
  KvRef<KvString> driverID = KvString::create("DriverID");
  KvRef<KvString> driverName = KvString::create("DriverName");
  KvRef<KvString> legendChannel = KvString::create("LegendChannel");
  KvRef<KvString> group = KvString::create("HwReportGroupName");
  KvRef<KvString> subGroup = KvString::create("HwReportSubGroupName");
  KvRef<KvString> channelInfo = KvString::create("HwReportChannelInfo");
  KvRef<KvString> channelName = KvString::create("ChannelName");
  KvRef<KvString> unitLabel = KvString::create("UnitLabel");
  KvRef<KvString> rawElements = KvString::create("RawElements");
  KvRef<KvString> stateNames = KvString::create("StateNames");
  KvRef<KvString> processedConfig = KvString::create("ProcessedChannelConfig");
  // Channel information.
  KvRef<KvString> channelUnit = KvString::create("HwReportChannelUnit");
  KvRef<KvString> channelConfig = KvString::create("HwReportChannelConfig");
  // A collection.
  KvRef<KvString> queryOptions = KvString::create("QueryOpts");
  KvRef<KvString> channels = KvString::create("HwReportChannels");
  KvRef<KvString> drivers = KvString::create("HwReportDrivers");
  KvRef<KvString> channelGroups = KvString::create("HwReportChannelGroups");
};

// Never freed, so that it outlives whatever a program still holds at its end.
inline const ChannelKeys& keys() {
  static const ChannelKeys* const all = new ChannelKeys();
  return *all;
}

// What a legend channel array holds, by index.
constexpr std::size_t kLegendChannelID = 0;
constexpr std::size_t kLegendTypeWord = 1;
constexpr std::size_t kLegendChannelName = 2;

// A driver's own properties; the names that a legend group shares with a channel are above.
constexpr std::string_view kLegendPublicProperty = "HwReportLegendPublic";
constexpr std::string_view kLegendProperty = "HwReportLegend";

}  // namespace tally
