// A shared library brings a platform of its own: the device registry of a device root, and a log
// that says on standard error what is wrong with it. It is made when it is first asked for.
#include "library_platform.h"

#include <memory>
#include <string>

#include <fmt/core.h>

#include "host/devices/device_registry.h"
#include "host/system/environment.h"

namespace tally {
namespace {

class ErrorLog final : public SystemLog {
 public:
  bool enabled(LogLevel level) const override { return level == LogLevel::Error; }
  void write(LogLevel level, std::string_view message) override {
    if (enabled(level)) fmt::print(stderr, "{}\n", message);
  }
};

// Never destroyed: what a program still holds at its end may ask for it.
Platform& libraryPlatform() {
  static auto* const services = new Platform(makeLibraryPlatform(deviceRootFromEnvironment()));
  return *services;
}

[[maybe_unused]] const bool registered = (setDefaultPlatform(libraryPlatform), true);

}  // namespace

Platform makeLibraryPlatform(std::string_view root) {
  Platform services;
  services.log = std::make_shared<ErrorLog>();
  const DeviceRoot device{std::string(root)};
  addDeviceRegistry(services, device, std::make_shared<const SystemTree>(device));
  return services;
}

void useDeviceRoot(std::string_view root) { libraryPlatform() = makeLibraryPlatform(root); }

}  // namespace tally
