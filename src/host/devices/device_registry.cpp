#include "host/devices/device_registry.h"

#include <algorithm>

#include "host/described/registry_description.h"
#include "host/devices/undescribed_source.h"
#include "host/flash/flash_source.h"
#include "host/flash/linux_flash_disks.h"
#include "host/kernel/ecc_events.h"
#include "host/kernel/kernel_statistics.h"
#include "host/registry/source_registry.h"
#include "platform/protocol/hub_protocol.h"
#include "platform/protocol/storage_protocol.h"

namespace tally {
namespace {

// A device that describes channels has those alone.
bool hasChannels(const RegistryEntry& entry) {
  return entry.className == kStatisticsHubClass ||
         entry.properties->get(kLegendPublicProperty) != nullptr;
}

bool isStorageDriver(const RegistryEntry& entry) {
  return std::ranges::count(kStorageDriverClasses, entry.className) > 0;
}

// Whether the storage driver is another than that of a flash disk.
bool isStorageDescribed(SourceRegistry& registry) {
  return std::ranges::any_of(kStorageDriverClasses, [&](std::string_view name) {
    const RegistryHandle service = registry.RegistryFindService(ServiceMatchingByClass(name));
    std::uint64_t id = kFlashEntryID;
    if (service != 0) registry.RegistryGetEntryID(service, &id);
    registry.HandleRelease(service);
    return id != kFlashEntryID;
  });
}

}  // namespace

void addDeviceRegistry(Platform& services, const DeviceRoot& root,
                       std::shared_ptr<const SystemTree> tree) {
  auto described =
      std::make_unique<RegistryDescription>(DeviceDirectory(root, "/device"), services.log);
  KernelDevice device{tree, services.log, nullptr};
  if (services.metricsStore) {
    device.days = std::make_shared<DailyAmounts>(services.metricsStore, services.clock);
    services.dailyCounters = device.days;
    services.kernelValues =
        std::make_shared<EccEvents>(services.kernelValues, device.tree, services.metricsStore);
  }
  auto kernel = std::make_unique<UndescribedSource>(
      std::make_unique<KernelStatistics>(std::move(device)), *described, hasChannels);
  const DiskReader disks(root, services.clock, std::move(tree));
  auto flash = std::make_unique<UndescribedSource>(std::make_unique<FlashSource>(disks), *described,
                                                   isStorageDriver);
  std::vector<std::unique_ptr<RegistrySource>> sources;
  sources.push_back(std::move(described));
  sources.push_back(std::move(kernel));
  sources.push_back(std::move(flash));
  const auto registry = std::make_shared<SourceRegistry>(std::move(sources));
  services.deviceRegistry = registry;
  services.flashDisks = std::make_shared<LinuxFlashDisks>(
      disks, [registry] { return isStorageDescribed(*registry); });
}

}  // namespace tally
