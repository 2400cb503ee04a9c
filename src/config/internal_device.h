// Whether this is an internal (engineering) build of the operating system.
#pragma once

#include "platform/platform.h"

namespace tally {

// Asked of the device once per platform, on first use, from any thread; then remembered.
bool isInternalDevice(Platform& platform);

}  // namespace tally
