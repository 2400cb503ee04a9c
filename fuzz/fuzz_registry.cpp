// registry.plist: its entries found, asked and connected to as clients do.
#include "described_folder.h"
#include "host/described/registry_description.h"
#include "host/registry/source_registry.h"

using namespace tally;
using fuzz::require;

namespace {

void callMethods(DeviceRegistry& registry, ConnectionHandle connection) {
  std::array<std::byte, 64> room;
  std::array<std::uint64_t, 2> scalars{};
  for (std::uint32_t method = 0; method < 6; ++method) {
    for (std::uint32_t flags = 0; flags < 2; ++flags) {
      const std::array<std::uint32_t, 6> request{method, flags};
      MethodCall call{.scalarInput = {scalars.data(), 1},
                      .structInput = std::as_bytes(std::span(request)),
                      .scalarOutput = scalars,
                      .structOutput = room};
      if (flags == 0 && method % 2 == 0) call.structInput = {};
      registry.ConnectionCallMethod(connection, method, call);
      require(call.structOutputSize <= room.size(), "no more is written than fits");
    }
  }
  const std::byte* address = nullptr;
  std::size_t length = 0;
  if (registry.ConnectionMapMemory(connection, static_cast<std::uint32_t>(scalars[0]), kMapAnywhere,
                                   &address, &length) == 0) {
    registry.ConnectionUnmapMemory(connection, static_cast<std::uint32_t>(scalars[0]), address);
  }
}

void useService(DeviceRegistry& registry, RegistryHandle service) {
  std::uint64_t id = 0;
  std::string name;
  registry.RegistryGetEntryID(service, &id);
  registry.RegistryGetName(service, &name);
  registry.RegistryCopyProperty(service, "HwReportLegend");
  registry.RegistrySearchProperty(service, "Nowhere");
  ConnectionHandle connection = 0;
  if (registry.ServiceOpenConnection(service, 0, &connection) == 0) {
    callMethods(registry, connection);
    registry.ServiceCloseConnection(connection);
  }
}

}  // namespace

FUZZ_TARGET(registry)(const std::uint8_t* data, std::size_t size) {
  static const fuzz::DescribedFolder folder;
  fuzz::Input input(data, size);
  folder.putInput("registry.plist", input);

  std::vector<std::unique_ptr<RegistrySource>> sources;
  sources.push_back(std::make_unique<RegistryDescription>(DeviceDirectory(folder.root, ""),
                                                          std::make_shared<fuzz::UnreadLog>()));
  SourceRegistry registry(std::move(sources));
  for (const std::string_view className : {"HwReportHub", "SPXStorage"}) {
    const auto service = registry.RegistryFindService(ServiceMatchingByClass(className));
    if (service != 0) useService(registry, service);
    registry.HandleRelease(service);
  }
  RegistryHandle iterator = 0;
  if (registry.RegistryCopyMatchingServices(KvDictionary::create(), &iterator) == 0) {
    for (int left = 8; left > 0; --left) {
      const RegistryHandle service = registry.RegistryIteratorNext(iterator);
      if (service == 0) break;
      useService(registry, service);
      registry.HandleRelease(service);
    }
    registry.HandleRelease(iterator);
  }
  require(registry.openHandles() == 0, "every handle is released");
  return 0;
}
