// The parts of the shared library that are not in its room.
#include "hwreport/device_root.h"
#include "library_platform.h"

namespace tally {

void HwReportSetDeviceRoot(std::string_view root) { useDeviceRoot(root); }

}  // namespace tally
