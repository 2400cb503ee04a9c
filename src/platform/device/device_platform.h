// The device registry of a device root.
#pragma once

#include <string>

#include "platform/platform.h"

namespace tally {

// Adds the registry to a platform that has a log. prefix is the root without a slash at its end.
void addDeviceRegistry(Platform& services, const std::string& prefix);

}  // namespace tally
