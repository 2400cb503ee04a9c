// The platform of a program that uses one of the libraries and installs none.
#pragma once

#include <string_view>

#include "platform/platform.h"

namespace tally {

Platform makeLibraryPlatform(std::string_view root);

// Takes the services of this device root from now on.
void useDeviceRoot(std::string_view root);

}  // namespace tally
