#include "host/devices/device_registry.h"

#include "host/described/registry_description.h"
#include "host/devices/undescribed_source.h"
#include "host/kernel/ecc_events.h"
#include "host/kernel/kernel_statistics.h"
#include "host/registry/source_registry.h"
#include "platform/protocol/hub_protocol.h"

namespace tally {
namespace {

// A device that describes channels has those alone.
bool hasChannels(const RegistryEntry& entry) {
  return entry.className == kStatisticsHubClass ||
         entry.properties->get(kLegendPublicProperty) != nullptr;
}

}  // namespace

void addDeviceRegistry(Platform& services, const DeviceRoot& root,
                       std::shared_ptr<const SystemTree> tree) {
  auto described =
      std::make_unique<RegistryDescription>(DeviceDirectory(root, "/device"), services.log);
  KernelDevice device{std::move(tree), services.log, nullptr};
  if (services.metricsStore) {
    device.days = std::make_shared<DailyAmounts>(services.metricsStore, services.clock);
    services.dailyCounters = device.days;
    services.kernelValues =
        std::make_shared<EccEvents>(services.kernelValues, device.tree, services.metricsStore);
  }
  auto kernel = std::make_unique<UndescribedSource>(
      std::make_unique<KernelStatistics>(std::move(device)), *described, hasChannels);
  std::vector<std::unique_ptr<RegistrySource>> sources;
  sources.push_back(std::move(described));
  sources.push_back(std::move(kernel));
  services.deviceRegistry = std::make_shared<SourceRegistry>(std::move(sources));
}

}  // namespace tally
