#include "host/host_platform.h"

#include "host/devices/device_registry.h"

namespace tally {

Platform makeHostPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options) {
  Platform services = makeLinuxPlatform(root, options);
  addDeviceRegistry(services, root);
  return services;
}

}  // namespace tally
