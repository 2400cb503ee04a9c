#include "host/devices/device_registry.h"

#include "host/described/registry_description.h"
#include "host/registry/source_registry.h"

namespace tally {

void addDeviceRegistry(Platform& services, const DeviceRoot& root) {
  std::vector<std::unique_ptr<RegistrySource>> sources;
  sources.push_back(
      std::make_unique<RegistryDescription>(DeviceDirectory(root, "/device"), services.log));
  services.deviceRegistry = std::make_shared<SourceRegistry>(std::move(sources));
}

}  // namespace tally
