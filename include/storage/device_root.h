// The device that the library reads.
#pragma once

#include <string_view>

#include "kv/export.h"

namespace tally {

// Takes the services of this device root from now on: its drivers, preferences, kernel values and
// logs. Without a call they are those of the environment variable TALLYRUN_ROOT, or else of "/".
// Call it before other threads use the library.
TALLY_API void StorageSetDeviceRoot(std::string_view root);

}  // namespace tally
