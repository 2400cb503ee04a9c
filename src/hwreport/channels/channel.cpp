// Reads a channel: its row, or its dictionary once that has been made.
#include "hwreport/channel.h"

#include "hwreport/channels/keys.h"
#include "hwreport/channels/naming.h"
#include "hwreport/channels/type_word.h"
#include "hwreport/rows/channel_frame.h"

namespace tally {
namespace {

template <class T>
T* valueOf(const KvDictionary* channel, const KvRef<KvString>& key,
           KvObject* ChannelShape::*common) {
  if (channel == nullptr) return nullptr;
  const auto row = FrameChannel::of(channel);
  if (row.frame == nullptr) return channel->getAs<T>(*key);
  return kvCast<T>(row.shape().*common);
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
  return valueOf<KvString>(channel, keys().group, &ChannelShape::group);
}

KvString* HwReportChannelGetSubGroup(const KvDictionary* channel) {
  return valueOf<KvString>(channel, keys().subGroup, &ChannelShape::subGroup);
}

std::uint64_t HwReportChannelGetUnit(const KvDictionary* channel) {
  const auto* const information =
      valueOf<KvDictionary>(channel, keys().channelInfo, &ChannelShape::information);
  return bitsOf(information != nullptr ? information->get(*keys().channelUnit) : nullptr);
}

std::uint64_t HwReportChannelGetDriverID(const KvDictionary* channel) {
  return bitsOf(valueOf<KvNumber>(channel, keys().driverID, &ChannelShape::driverID));
}

KvString* HwReportChannelGetDriverName(const KvDictionary* channel) {
  return valueOf<KvString>(channel, keys().driverName, &ChannelShape::driverName);
}

std::uint64_t HwReportChannelGetChannelID(const KvDictionary* channel) {
  return bitsOf(legendElement(channel, kLegendChannelID));
}

KvString* HwReportChannelGetChannelName(KvDictionary* channel) {
  if (channel == nullptr) return nullptr;
  const auto row = FrameChannel::of(channel);
  if (row.frame != nullptr && !row.shape().hasOddName) return row.frame->cacheName(*row.pending);
  if (auto* cached = channel->getAs<KvString>(*keys().channelName)) return cached;
  auto name = nameOfLegend(legendOf(channel));
  if (name) channel->set(keys().channelName, name);
  return name.get();  // the channel owns it
}

}  // namespace tally
