#include "host_platform.h"

#include "platform/device/device_platform.h"

namespace tally {

Platform makeHostPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options) {
  Platform services = makeLinuxPlatform(root, options);
  addDeviceRegistry(services, root);
  return services;
}

}  // namespace tally
