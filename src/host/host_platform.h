// The platform of the programs: Linux, and the devices that a device root describes.
#pragma once

#include "host/linux_platform.h"
#include "platform/platform.h"

namespace tally {

// All services of the device whose root is the folder. Cheap: nothing is opened or read before a
// service is used.
Platform makeHostPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options = {});

}  // namespace tally
