// The part of the shared library that is not in its room: the platform of a program that installs
// none. It is made when it is first asked for.
#include <string>

#include "host/host_platform.h"
#include "host/system/environment.h"
#include "library_root.h"
#include "storage/c_api/handles.h"
#include "storage/device_root.h"

namespace tally {
namespace {

// Never destroyed: what a program still holds at its end may ask for it.
Platform& libraryPlatform() {
  static auto* const services = new Platform(makeHostPlatform(deviceRootFromEnvironment()));
  return *services;
}

[[maybe_unused]] const bool registered = (setDefaultPlatform(libraryPlatform), true);

}  // namespace

void StorageSetDeviceRoot(std::string_view root) {
  libraryPlatform() = makeHostPlatform(std::string(root));
}

}  // namespace tally

int tallystorage_open(const char* root, tallystorage_device** device) {
  using namespace tally;
  return cCall([&] {
    if (!cClear(device)) return cBadArgument("the device's output is NULL");
    const auto path = rootOfCaller(root);
    if (!path) return cFailure(kCNotFound, path.error().message);
    *device = new tallystorage_device{{}, sharePlatform(makeHostPlatform(*path))};
    return kCOk;
  });
}
