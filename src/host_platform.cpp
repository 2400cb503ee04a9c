#include "host_platform.h"

#include "platform/device/device_platform.h"
#include "platform/linux/linux_platform.h"

namespace tally {

Platform makeHostPlatform(const std::string& root) {
  Platform services = makeLinuxPlatform(root);
  addDeviceRegistry(services, devicePrefix(root));
  return services;
}

}  // namespace tally
