// Which device the library looks at.
#pragma once

#include <string_view>

#include "kv/export.h"

namespace tally {

// Takes the device registry of this root from now on; subscriptions that were made before keep
// theirs. Without a call it is that of the environment variable TALLYRUN_ROOT, or else of "/".
// Before other threads use the library.
TALLY_API void HwReportSetDeviceRoot(std::string_view root);

}  // namespace tally
