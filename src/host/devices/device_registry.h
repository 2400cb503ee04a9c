// The device registry of a device root.
#pragma once

#include <memory>

#include "base/files/device_root.h"
#include "host/tree/system_tree.h"
#include "platform/platform.h"

namespace tally {

// Adds the registry to a platform that has a log, and the daily amounts of counters to one that
// also has a store and a clock. The tree is that of the root.
void addDeviceRegistry(Platform& services, const DeviceRoot& root,
                       std::shared_ptr<const SystemTree> tree);

}  // namespace tally
