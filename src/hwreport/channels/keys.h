// The keys of channel dictionaries and collections. Each is one shared object, so that a channel
// takes no memory for its keys and a look-up compares pointers.
#pragma once

#include "kv/value.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {

struct ChannelKeys {
  // A channel.
  KvRef<KvString> driverID = KvString::create("DriverID");
  KvRef<KvString> driverName = KvString::create("DriverName");
  KvRef<KvString> legendChannel = KvString::create("LegendChannel");
  KvRef<KvString> group = KvString::create(kLegendGroupName);
  KvRef<KvString> subGroup = KvString::create(kLegendSubGroupName);
  KvRef<KvString> channelInfo = KvString::create(kLegendChannelInfo);
  KvRef<KvString> channelName = KvString::create("ChannelName");
  KvRef<KvString> unitLabel = KvString::create("UnitLabel");
  KvRef<KvString> rawElements = KvString::create("RawElements");
  KvRef<KvString> stateNames = KvString::create("StateNames");
  KvRef<KvString> processedConfig = KvString::create("ProcessedChannelConfig");
  // Channel information.
  KvRef<KvString> channelUnit = KvString::create(kLegendChannelUnit);
  KvRef<KvString> channelConfig = KvString::create("HwReportChannelConfig");
  // A collection.
  KvRef<KvString> queryOptions = KvString::create("QueryOpts");
  KvRef<KvString> channels = KvString::create(kLegendChannelsKey);
  KvRef<KvString> drivers = KvString::create("HwReportDrivers");
  KvRef<KvString> channelGroups = KvString::create("HwReportChannelGroups");
};

// Never freed, so that it outlives every object that a program still has at its end.
inline const ChannelKeys& keys() {
  static const ChannelKeys* const all = new ChannelKeys();
  return *all;
}

}  // namespace tally
