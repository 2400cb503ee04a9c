// Checks of what drivers and the kernel give: storage, statistics channels, snapshots, space.
#include "tools/doctor/health_drivers.h"

#include "hwreport/channels.h"
#include "platform/protocol/hub_protocol.h"
#include "storage/exporter.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

void examineStorage(Platform& platform, HealthChecks& checks) {
  constexpr const char* kSubject = "flash storage";
  const NandExporter* exporter = nullptr;
  const RegistryHandle service = findNandExporter(&exporter);
  if (service == 0) {
    checks.push_back({Health::Missing, kSubject, "no driver that exports its figures"});
    return;
  }
  DeviceRegistry& registry = *platform.deviceRegistry;
  ConnectionHandle connection = 0;
  const RegistryResult result = registry.ServiceOpenConnection(service, 0, &connection);
  registry.HandleRelease(service);
  if (result == 0) registry.ServiceCloseConnection(connection);
  checks.push_back({result == 0 ? Health::Ok : Health::Wrong, kSubject,
                    result == 0 ? fmt::format("driver {}", exporter->className)
                                : fmt::format("driver {} cannot be opened: error {:#x}",
                                              exporter->className, result)});
}

void examineChannels(Platform& platform, HealthChecks& checks) {
  const auto channels = HwReportCopyAllChannels(0);
  const std::int32_t count = channels ? HwReportGetChannelCount(channels.get()) : 0;
  DeviceRegistry& registry = *platform.deviceRegistry;
  const RegistryHandle hub =
      registry.RegistryFindService(ServiceMatchingByClass(kStatisticsHubClass));
  registry.HandleRelease(hub);
  const std::string published = counted(static_cast<std::uint64_t>(std::max(count, 0)), "channel");
  checks.push_back({count > 0 && hub != 0 ? Health::Ok : Health::Missing, "statistics",
                    hub != 0 ? published : published + ", no hub to sample them"});
}

void examineKernelServices(Platform& platform, HealthChecks& checks) {
  const bool stackshot = platform.stackshot->stackshotConfigCreate() != nullptr;
  checks.push_back({stackshot ? Health::Ok : Health::Missing, "stackshot",
                    stackshot ? "can be taken" : "the kernel takes none"});
  const bool purgeable = platform.purgeableSpace->isAvailable();
  checks.push_back({purgeable ? Health::Ok : Health::Missing, "purgeable space",
                    purgeable ? "the service answers" : "no such service"});
  const bool events = platform.analyticsEvents->isAvailable();
  checks.push_back({events ? Health::Ok : Health::Missing, "analytics events",
                    events ? "can be sent" : "no such service"});
}

}  // namespace

void examineDrivers(const ToolContext& context, HealthChecks& checks) {
  Platform& platform = *context.platform;
  examineStorage(platform, checks);
  examineChannels(platform, checks);
  examineKernelServices(platform, checks);
}

}  // namespace tally::tools
