// What the shared library has that its room has not.
#include "hwreport/device_root.h"
#include "library_platform.h"

namespace tally {

void HwReportSetDeviceRoot(std::string_view root) { useDeviceRoot(root); }

}  // namespace tally
