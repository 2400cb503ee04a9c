#include "host/host_platform.h"

#include "host/devices/device_registry.h"

namespace tally {

Platform makeHostPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options) {
  LinuxPlatformOptions shared = options;
  if (!shared.tree) shared.tree = std::make_shared<const SystemTree>(root);
  Platform services = makeLinuxPlatform(root, shared);
  addDeviceRegistry(services, root, shared.tree);
  return services;
}

}  // namespace tally
