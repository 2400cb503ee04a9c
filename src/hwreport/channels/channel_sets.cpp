// The channels of many drivers, and the filters over them.
#include "hwreport/channels.h"

#include <functional>

#include "hwreport/channel.h"
#include "hwreport/channels/channel_builder.h"
#include "hwreport/channels/channel_walk.h"
#include "hwreport/channels/drivers.h"
#include "hwreport/channels/error_maker.h"
#include "hwreport/channels/keys.h"
#include "platform/device_registry.h"

namespace tally {
namespace {

// The step of a walk that merges a driver's channels into a collection. A failure keeps the merge's
// own error.
HwResult mergeDriver(KvDictionary& collection, KvDictionary& driverChannels,
                     KvRef<HwReportError>* error) {
  return walkFailed(HwReportMergeChannels(&collection, &driverChannels, error)) ? HwErrGeneral : 0;
}

// The result of a walk over drivers. A failure that no step has reported is reported here.
KvRef<KvDictionary> walked(HwResult result, bool explained, KvRef<KvDictionary> collection,
                           KvRef<HwReportError>* error) {
  if (result == 0) return collection;
  if (!explained) reportError(error, result);
  return nullptr;
}

KvRef<KvDictionary> requireMatching(KvDictionary* matching, std::int32_t options,
                                    KvRef<HwReportError>* error) {
  if (matching != nullptr) return HwReportCreateAggregate(options);
  reportError(error, HwErrBadArgument, "no matching dict");
  return nullptr;
}

bool sameText(const KvString* a, const KvString* b) {
  return a != nullptr && b != nullptr && a->view() == b->view();
}

// The channels of all drivers. Those of each are handed to the step before they are merged.
KvRef<KvDictionary> copyAllChannels(std::int32_t options, KvRef<HwReportError>* error,
                                    const std::function<void(KvDictionary* channels)>& step) {
  // The presence of the property is enough, whatever its value.
  const auto matching = KvDictionary::create(
      {{kMatchProperty, KvDictionary::create({{kLegendPublicProperty, KvBoolean::of(true)}})}});
  auto collection = HwReportCreateAggregate(options);
  bool explained = false;
  const HwResult result = walkDrivers(*matching, [&](HwRegistryEntry driver) -> HwResult {
    KvRef<HwReportError> driverError;
    const auto channels = HwReportCopyChannelsForDriver(driver, options, &driverError);
    if (!channels) {
      if (options < 0) {
        printError(options, HwReportCopyDriverName(driver).get(), driverError.get());
      }
      return 0;
    }
    if (step) step(channels.get());
    const HwResult merged = mergeDriver(*collection, *channels, error);
    explained = merged != 0;
    return merged;
  });
  return walked(result, explained, std::move(collection), error);
}

// All channels for which keep is true.
template <class Keep>
KvRef<KvDictionary> copyChannelsWhere(std::int32_t options, KvRef<HwReportError>* error,
                                      Keep keep) {
  const auto filter = [&](KvDictionary* channels) {
    return pruneChannels(channels, [&](KvDictionary* channel) {
      return keep(channel) ? HwIterContinue : HwIterDrop;
    });
  };
  // A driver's channels are filtered while they are in the cache. Where there are levels, a channel
  // that is dropped still decides on their order.
  if ((options & (kHwReportByDriver | kHwReportByGroup)) == 0) {
    return copyAllChannels(options, error, filter);
  }
  auto collection = copyAllChannels(options, error, nullptr);
  if (!collection) return nullptr;
  if (!walkFailed(filter(collection.get()))) return collection;
  reportError(error, HwErrGeneral, "channel pruning failed");
  return nullptr;
}

}  // namespace

KvRef<KvDictionary> HwReportCopyAllChannels(std::int32_t options, KvRef<HwReportError>* error) {
  return copyAllChannels(options, error, nullptr);
}

KvRef<KvDictionary> HwReportCopyChannelsForDrivers(KvDictionary* matching, std::int32_t options,
                                                   KvRef<HwReportError>* error) {
  auto collection = requireMatching(matching, options, error);
  if (!collection) return nullptr;
  bool explained = false;
  const HwResult result = walkDrivers(*matching, [&](HwRegistryEntry driver) -> HwResult {
    const auto channels = HwReportCopyChannelsForDriver(driver, 0, nullptr);
    if (!channels) return HwErrGeneral;
    const HwResult merged = mergeDriver(*collection, *channels, error);
    explained = merged != 0;
    return merged;
  });
  return walked(result, explained, std::move(collection), error);
}

KvRef<KvDictionary> HwReportCopyChannelsWithID(KvDictionary* matching, std::uint64_t channelID,
                                               KvRef<HwReportError>* error) {
  auto collection = requireMatching(matching, 0, error);
  if (!collection) return nullptr;
  bool explained = false;
  const HwResult result = walkDrivers(*matching, [&](HwRegistryEntry driver) -> HwResult {
    explained = true;  // each step of it makes its own error
    auto legendChannel = KvArray::create({KvNumber::uint64(channelID), KvNumber::uint64(0)});
    ChannelOwner owner;
    if (isLegendChannel(*legendChannel)) {
      if (const HwResult failure = readOwner(driver, &owner, error)) return failure;
    }
    const auto channel = makeChannel(owner, {}, std::move(legendChannel), error);
    if (!channel) return HwErrGeneral;
    const HwResult added = addChannel(collection.get(), channel.get(), 0, error);
    explained = added != 0;
    return added;
  });
  return walked(result, explained, std::move(collection), error);
}

KvRef<KvDictionary> HwReportCopyChannelsInCategories(std::uint16_t categories, std::int32_t options,
                                                     KvRef<HwReportError>* error) {
  return copyChannelsWhere(options, error, [&](const KvDictionary* channel) {
    return (HwReportChannelGetCategories(channel) & categories) != 0;
  });
}

KvRef<KvDictionary> HwReportCopyChannelsOfFormat(std::uint8_t format, std::int32_t options,
                                                 KvRef<HwReportError>* error) {
  return copyChannelsWhere(options, error, [&](const KvDictionary* channel) {
    return HwReportChannelGetFormat(channel) == format;
  });
}

KvRef<KvDictionary> HwReportCopyChannelsWithUnit(std::uint64_t unit, std::int32_t options,
                                                 KvRef<HwReportError>* error) {
  return copyChannelsWhere(options, error, [&](const KvDictionary* channel) {
    return HwReportChannelGetUnit(channel) == unit;
  });
}

int HwReportSelectChannelsInGroup(KvDictionary* collection, const KvString* group,
                                  const KvString* subgroup, KvRef<HwReportError>* error) {
  if (group == nullptr && subgroup == nullptr) {
    reportError(error, HwErrBadArgument, "no group or subgroup!");
    return 1;
  }
  const int result = pruneChannels(collection, [&](KvDictionary* channel) {
    const bool keep =
        (group == nullptr || sameText(HwReportChannelGetGroup(channel), group)) &&
        (subgroup == nullptr || sameText(HwReportChannelGetSubGroup(channel), subgroup));
    return keep ? HwIterContinue : HwIterDrop;
  });
  if (!walkFailed(result)) return result;
  reportError(error, HwErrGeneral, "channel pruning failed");
  return 1;
}

KvRef<KvDictionary> HwReportCopyChannelsInGroup(const KvString* group, const KvString* subgroup,
                                                std::int32_t options, KvRef<HwReportError>* error) {
  auto collection = HwReportCopyAllChannels(options, error);
  if (!collection) return nullptr;
  const int result = HwReportSelectChannelsInGroup(collection.get(), group, subgroup, error);
  return walkFailed(result) ? nullptr : std::move(collection);
}

}  // namespace tally
