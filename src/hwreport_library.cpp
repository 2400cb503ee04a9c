// The parts of the shared library that are not in its room.
#include <string>

#include "hwreport/c_api/handles.h"
#include "hwreport/device_root.h"
#include "library_platform.h"
#include "library_root.h"

namespace tally {

void HwReportSetDeviceRoot(std::string_view root) { useDeviceRoot(root); }

}  // namespace tally

int hwreport_open(const char* root, hwreport_device** device) {
  using namespace tally;
  return cCall([&] {
    if (!cClear(device)) return cBadArgument("the device's output is NULL");
    const auto path = rootOfCaller(root);
    if (!path) return cFailure(kCNotFound, path.error().message);
    *device = new hwreport_device{{}, sharePlatform(makeLibraryPlatform(*path))};
    return kCOk;
  });
}
