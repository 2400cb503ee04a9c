// Reads the dictionary of a channel.
#include "hwreport/channel.h"

#include "hwreport/channels/keys.h"
#include "hwreport/channels/naming.h"
#include "hwreport/channels/type_word.h"

namespace tally {
namespace {

template <class T>
T* valueOf(const KvDictionary* channel, const KvRef<KvString>& key) {
  return channel != nullptr ? channel->getAs<T>(*key) : nullptr;
}

}  // namespace

std::uint8_t HwReportChannelGetFormat(const KvDictionary* channel) {
  const auto type = typeWordOf(channel);
  return type ? type->format() : kHwReportFormatUnknown;
}

std::uint16_t HwReportChannelGetCategories(const KvDictionary* channel) {
  const auto type = typeWordOf(channel);
  return type ? type->categories() : std::uint16_t{0xFFFF};
}

KvString* HwReportChannelGetGroup(const KvDictionary* channel) {
  return valueOf<KvString>(channel, keys().group);
}

KvString* HwReportChannelGetSubGroup(const KvDictionary* channel) {
  return valueOf<KvString>(channel, keys().subGroup);
}

std::uint64_t HwReportChannelGetUnit(const KvDictionary* channel) {
  const auto* information = valueOf<KvDictionary>(channel, keys().channelInfo);
  return bitsOf(valueOf<KvNumber>(information, keys().channelUnit));
}

std::uint64_t HwReportChannelGetDriverID(const KvDictionary* channel) {
  return bitsOf(valueOf<KvNumber>(channel, keys().driverID));
}

KvString* HwReportChannelGetDriverName(const KvDictionary* channel) {
  return valueOf<KvString>(channel, keys().driverName);
}

std::uint64_t HwReportChannelGetChannelID(const KvDictionary* channel) {
  return bitsOf(legendElement(channel, kLegendChannelID));
}

KvString* HwReportChannelGetChannelName(KvDictionary* channel) {
  if (channel == nullptr) return nullptr;
  if (auto* cached = channel->getAs<KvString>(*keys().channelName)) return cached;
  auto name = KvRef<KvString>::share(kvCast<KvString>(legendElement(channel, kLegendChannelName)));
  const KvObject* const id = legendElement(channel, kLegendChannelID);
  if (!name && bitsOf(id) != kHwReportInvalidValue) name = nameOfID(bitsOf(id));
  if (name) channel->set(keys().channelName, name);
  return name.get();  // the channel owns it
}

}  // namespace tally
