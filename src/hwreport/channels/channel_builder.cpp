#include "hwreport/channels/channel_builder.h"

#include "hwreport/channel.h"
#include "hwreport/channels.h"
#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "hwreport/channels/type_word.h"

namespace tally {
namespace {

// The dictionary under a key, made if absent; null when the value is of another type.
KvDictionary* descend(KvDictionary* level, const KvRef<KvString>& key) {
  if (level == nullptr) return nullptr;
  if (KvObject* const held = level->get(*key)) return kvCast<KvDictionary>(held);
  auto made = KvDictionary::create();
  level->set(key, made);
  return made.get();
}

KvDictionary* descendNamed(KvDictionary* level, const KvRef<KvString>& key, KvString* name) {
  return descend(descend(level, key), KvRef<KvString>::share(name));
}

// The level that the channel belongs to. Only existing values can be of the wrong type, so a
// failure makes no level.
KvDictionary* placeOf(KvDictionary* level, const KvDictionary& channel, std::int32_t options) {
  if ((options & kHwReportByDriver) != 0) {
    KvString* const driver = HwReportChannelGetDriverName(&channel);
    if (driver == nullptr) return nullptr;
    level = descendNamed(level, keys().drivers, driver);
  }
  KvString* const group = HwReportChannelGetGroup(&channel);
  if ((options & kHwReportByGroup) == 0 || group == nullptr) return level;
  level = descendNamed(level, keys().channelGroups, group);
  KvString* const subGroup = HwReportChannelGetSubGroup(&channel);
  return subGroup != nullptr ? descendNamed(level, keys().channelGroups, subGroup) : level;
}

bool appendAt(KvDictionary* level, KvDictionary& channel) {
  if (level == nullptr) return false;
  KvObject* held = level->get(*keys().channels);
  if (held == nullptr) {
    auto made = KvArray::create();
    level->set(keys().channels, made);
    held = made.get();
  }
  auto* const channels = kvCast<KvArray>(held);
  if (channels == nullptr) return false;
  channels->append(KvRef<KvDictionary>::share(&channel));
  return true;
}

}  // namespace

std::int32_t optionsOf(const KvDictionary* collection) {
  const auto* options =
      collection != nullptr ? collection->getAs<KvNumber>(*keys().queryOptions) : nullptr;
  return options != nullptr ? options->asInt32() : 0;
}

bool isLegendChannel(const KvArray& legendChannel) {
  return bitsOf(legendChannel.get(kLegendChannelID)) != kHwReportInvalidValue &&
         bitsOf(legendChannel.get(kLegendTypeWord)) != kHwReportInvalidValue;
}

KvRef<KvDictionary> makeChannel(const ChannelOwner& owner, const ChannelGroup& group,
                                KvRef<KvArray> legendChannel, KvRef<HwReportError>* error) {
  if (!isLegendChannel(*legendChannel) || !owner.driverID || !owner.driverName) {
    reportError(error, HwErrGeneral, "couldn't create channel");
    return nullptr;
  }
  auto channel = KvDictionary::create(6);
  channel->set(keys().driverID, owner.driverID);
  channel->set(keys().driverName, owner.driverName);
  channel->set(keys().legendChannel, std::move(legendChannel));
  if (group.group) channel->set(keys().group, group.group);
  if (group.subGroup) channel->set(keys().subGroup, group.subGroup);
  if (group.information) channel->set(keys().channelInfo, group.information);
  return channel;
}

HwResult addChannel(KvObject* collection, KvObject* channel, std::int32_t options,
                    KvRef<HwReportError>* error) {
  constexpr const char* kMessage = "_addChannel() failed";
  auto* const level = kvCast<KvDictionary>(collection);
  auto* const added = kvCast<KvDictionary>(channel);
  if (level == nullptr || added == nullptr) return reportError(error, HwErrBadArgument, kMessage);
  if (!appendAt(placeOf(level, *added, options), *added)) {
    return reportError(error, HwErrGeneral, kMessage);
  }
  return 0;
}

KvRef<KvDictionary> HwReportCreateAggregate(std::int32_t options) {
  auto collection = KvDictionary::create();
  collection->set(keys().queryOptions, KvNumber::int32(options));
  return collection;
}

HwResult HwReportAddChannelDescription(KvDictionary* collection, std::uint64_t driverID,
                                       KvString* driverName, std::uint64_t channelID,
                                       std::uint64_t typeWord, KvString* channelName,
                                       KvString* group, KvString* subgroup,
                                       KvDictionary* information, KvRef<HwReportError>* error) {
  auto legendChannel = KvArray::create({KvNumber::uint64(channelID), KvNumber::uint64(typeWord)});
  legendChannel->append(KvRef<KvString>::share(channelName));
  const auto channel = makeChannel({KvNumber::uint64(driverID), KvRef<KvString>::share(driverName)},
                                   {KvRef<KvString>::share(group), KvRef<KvString>::share(subgroup),
                                    KvRef<KvDictionary>::share(information)},
                                   std::move(legendChannel), error);
  if (!channel) return HwErrGeneral;
  return addChannel(collection, channel.get(), optionsOf(collection), error);
}

int HwReportMergeChannels(KvDictionary* destination, KvDictionary* source,
                          KvRef<HwReportError>* error) {
  if (destination == nullptr || source == nullptr || destination == source) {
    reportError(error, HwErrBadArgument, "bad argument");
    return HwIterFailed;
  }
  const std::int32_t options = optionsOf(destination);
  bool added = true;
  const int result = iterateChannels(source, [&](KvDictionary* channel) {
    added = addChannel(destination, channel, options, error) == 0;
    return added ? HwIterContinue : 1;
  });
  if (walkFailed(result) && added) reportError(error, HwErrGeneral);  // the source is malformed
  return result;
}

}  // namespace tally
