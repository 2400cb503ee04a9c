// Reads drivers: which match, and the channels that their legends describe.
#pragma once

#include <functional>

#include "hwreport/channels.h"
#include "hwreport/channels/channel_builder.h"

namespace tally {

// Calls step with each matching driver; a result that is not 0 stops the walk and is its result.
// HwErrRegistryChanged when the registry changed meanwhile.
HwResult walkDrivers(KvDictionary& matching,
                     const std::function<HwResult(HwRegistryEntry driver)>& step);

// Reads what the driver's channels share. Returns the registry's code on failure.
HwResult readOwner(HwRegistryEntry driver, ChannelOwner* owner, KvRef<HwReportError>* error);

}  // namespace tally
