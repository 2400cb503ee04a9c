// Channel collections: finding the channels that drivers publish, choosing, merging and walking.
//
// A collection is a KvDictionary: channels in arrays, flat, or below a level for each driver, group
// and subgroup. Channels are shared between collections that were built from one another. Neither
// may be used from two threads at once, since reading a channel writes caches into it.
#pragma once

#include <cstdint>
#include <functional>

#include "hwreport/error.h"
#include "kv/value.h"

namespace tally {

// Options of a collection, a signed word of bits.
constexpr std::int32_t kHwReportByDriver = 1;
constexpr std::int32_t kHwReportByGroup = 2;
// HwReportCopyAllChannels prints every driver's failure to standard error.
constexpr std::int32_t kHwReportPrintErrors = INT32_MIN;

// What a callback returns. A result with bit 0 set stops the walk and becomes its result; others
// are combined by OR.
constexpr int HwIterContinue = 0;
constexpr int HwIterDrop = 16;
constexpr int HwIterFailed = 0x111;  // also the result of a walk over a malformed collection

// Gets a borrowed channel. It may change the channel but not the collection it is walked in. A walk
// without a callback fails.
using HwReportCallback = std::function<int(KvDictionary* channel)>;

// A handle of the device registry's entry of a driver; the caller keeps it.
using HwRegistryEntry = std::uint32_t;

// An empty collection.
TALLY_API KvRef<KvDictionary> HwReportCreateAggregate(std::int32_t options);

// The channels of one driver; none when it does not publish a legend. Null on failure: a handle
// that is not in use, a legend that is missing or not an array, or a channel that cannot be made. A
// malformed legend group ends the collection there, without an error.
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsForDriver(HwRegistryEntry driver,
                                                            std::int32_t options,
                                                            KvRef<HwReportError>* error = nullptr);
// The channels of every driver that publishes some. A driver that cannot be read is passed over.
// Null when the registry changed meanwhile (HwErrRegistryChanged): ask again.
TALLY_API KvRef<KvDictionary> HwReportCopyAllChannels(std::int32_t options,
                                                      KvRef<HwReportError>* error = nullptr);
// The same for the drivers that match a dictionary of the registry ("HwProviderClass",
// "HwNameMatch", "HwEntryIDMatch", "HwPropertyMatch"); here a driver that cannot be read fails.
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsForDrivers(KvDictionary* matching,
                                                             std::int32_t options,
                                                             KvRef<HwReportError>* error = nullptr);
// One channel with this id for each matching driver, without looking at legends. Its format is
// known after the first sample.
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsWithID(KvDictionary* matching,
                                                         std::uint64_t channelID,
                                                         KvRef<HwReportError>* error = nullptr);

// All channels that share a category; a channel whose type cannot be read is in every category.
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsInCategories(
    std::uint16_t categories, std::int32_t options, KvRef<HwReportError>* error = nullptr);
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsOfFormat(std::uint8_t format,
                                                           std::int32_t options,
                                                           KvRef<HwReportError>* error = nullptr);
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsWithUnit(std::uint64_t unit, std::int32_t options,
                                                           KvRef<HwReportError>* error = nullptr);
// All channels of a group, a subgroup or both; one of the two may be null.
TALLY_API KvRef<KvDictionary> HwReportCopyChannelsInGroup(const KvString* group,
                                                          const KvString* subgroup,
                                                          std::int32_t options,
                                                          KvRef<HwReportError>* error = nullptr);
// Drops every other channel from a collection. An odd result is a failure.
TALLY_API int HwReportSelectChannelsInGroup(KvDictionary* collection, const KvString* group,
                                            const KvString* subgroup,
                                            KvRef<HwReportError>* error = nullptr);

// Adds every channel of source (the same objects) to destination, grouped by its options. An odd
// result is a failure.
TALLY_API int HwReportMergeChannels(KvDictionary* destination, KvDictionary* source,
                                    KvRef<HwReportError>* error = nullptr);
// Adds one channel without a legend. Channel name, group, subgroup and information may be null;
// the information is shared, not copied (HwReportCreateUnitInfo makes one).
TALLY_API HwResult HwReportAddChannelDescription(KvDictionary* collection, std::uint64_t driverID,
                                                 KvString* driverName, std::uint64_t channelID,
                                                 std::uint64_t typeWord, KvString* channelName,
                                                 KvString* group, KvString* subgroup,
                                                 KvDictionary* information,
                                                 KvRef<HwReportError>* error = nullptr);

// Removes the channels for which the callback returns HwIterDrop, and levels that end empty. They
// are gone when the call returns, also when the callback stopped it.
TALLY_API int HwReportPrune(KvDictionary* collection, const HwReportCallback& callback);
// Visits every channel: those of a level in order, then its drivers, then its groups.
TALLY_API int HwReportIterate(KvDictionary* collection, const HwReportCallback& callback);
// The number of channels at every level; -1 for a malformed collection.
TALLY_API std::int32_t HwReportGetChannelCount(KvDictionary* collection);

// "NAME <id 0xID>" of a registry entry; null when the registry does not answer.
TALLY_API KvRef<KvString> HwReportCopyDriverName(HwRegistryEntry driver);
// "PROGRAM <pid N>", a driver name for channels of the process itself.
TALLY_API KvRef<KvString> HwReportCopyCurrentProcessName();
// Channel information that says nothing but the unit.
TALLY_API KvRef<KvDictionary> HwReportCreateUnitInfo(std::uint64_t unit);

}  // namespace tally
