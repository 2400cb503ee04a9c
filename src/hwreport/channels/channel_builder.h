// Makes channel dictionaries and puts them into collections.
#pragma once

#include <cstdint>

#include "hwreport/error.h"
#include "kv/value.h"

namespace tally {

// What the channels of one driver share; the objects are shared, not copied.
struct ChannelOwner {
  KvRef<KvNumber> driverID;
  KvRef<KvString> driverName;
};

// What the channels of one legend group share; each may be null.
struct ChannelGroup {
  KvRef<KvString> group;
  KvRef<KvString> subGroup;
  KvRef<KvDictionary> information;
};

// True when the legend channel array has the id and type word that a channel needs.
bool isLegendChannel(const KvArray& legendChannel);

// A channel of a legend channel array, which is shared. Null unless isLegendChannel and the owner
// is whole.
KvRef<KvDictionary> makeChannel(const ChannelOwner& owner, const ChannelGroup& group,
                                KvRef<KvArray> legendChannel, KvRef<HwReportError>* error);

// Appends the channel at the place that the options word gives, and makes missing levels.
// HwErrBadArgument when either is not a dictionary, HwErrGeneral when the place cannot be reached;
// the collection is then unchanged.
HwResult addChannel(KvObject* collection, KvObject* channel, std::int32_t options,
                    KvRef<HwReportError>* error);

// The options word of a collection; 0 when it has none.
std::int32_t optionsOf(const KvDictionary* collection);

}  // namespace tally
