// Interest lists at the statistics hub: parsed, served from drivers of any values, and mapped.
#include "described_folder.h"
#include "host/described/described_hub.h"
#include "platform/protocol/hub_protocol.h"

using namespace tally;
using fuzz::require;

namespace {

constexpr std::uint32_t kStart = kHubOpen, kConfigure = kHubConfigureInterests,
                        kUpdate = kHubUpdate;
constexpr std::size_t kElement = 64;

std::shared_ptr<const RegistrySource::Entries> takeDrivers(fuzz::Input& input) {
  auto drivers = std::make_shared<RegistrySource::Entries>();
  for (int left = input.take<std::uint8_t>() % 4; left > 0; --left) {
    auto driver = std::make_shared<RegistryEntry>();
    driver->id = input.take<std::uint8_t>();
    driver->properties = fuzz::ValueReader(input).takeDictionary();
    drivers->push_back(std::move(driver));
  }
  return drivers;
}

}  // namespace

FUZZ_TARGET(interest_lists)(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto drivers = takeDrivers(input);
  const bool isRaw = input.takeFlag();
  const auto hub = isRaw ? fuzz::ValueReader(input).takeDictionary() : nullptr;
  const auto list = input.takeRest();
  const auto files = std::make_shared<DescribedFiles>(
      DeviceDirectory(DeviceRoot("/nonexistent"), ""), std::make_shared<fuzz::UnreadLog>());

  RegistryResult result = 0;
  const auto client = openDescribedHub(hub, drivers, files, &result);
  require((client != nullptr) == (result == kRegistrySuccess), "a client or a reason");
  if (client == nullptr) return 0;
  MethodCall start;
  client->call(kStart, start);
  std::uint64_t token = 0;
  MethodCall configure{.structInput = list, .scalarOutput = {&token, 1}};
  if (client->call(kConfigure, configure) != kRegistrySuccess) return 0;
  require(list.size() % 24 == 8, "only a whole list is configured");
  std::span<const std::byte> memory;
  if (client->map(static_cast<std::uint32_t>(token), &memory) != kRegistrySuccess) return 0;
  require(!memory.empty(), "a region is never empty");
  require(isRaw || memory.size() % kElement == 0, "a region is whole elements");
  MethodCall update{.scalarInput = {&token, 1}};
  for (int refresh = 0; refresh < 3; ++refresh) client->call(kUpdate, update);
  require(client->unmap(static_cast<std::uint32_t>(token), memory.data()) == kRegistrySuccess,
          "what was mapped is unmapped");
  return 0;
}
