// The device registry of a device root.
#pragma once

#include "base/files/device_root.h"
#include "platform/platform.h"

namespace tally {

// Adds the registry to a platform that has a log, and the daily amounts of counters to one that
// also has a store and a clock.
void addDeviceRegistry(Platform& services, const DeviceRoot& root);

}  // namespace tally
