// The daily job of a product whose device facts come from its own configuration, not from Linux:
// one service of the platform is replaced, and asks the one that it replaces for the rest.
#include <memory>
#include <utility>

#include "driver/daily_job.h"
#include "host/host_platform.h"
#include "host/linux_platform.h"
#include "host/system/environment.h"
#include "platform/platform.h"

namespace {

using namespace tally;

class ProductInformation final : public DeviceInformation {
 public:
  explicit ProductInformation(std::shared_ptr<DeviceInformation> otherwise)
      : otherwise_(std::move(otherwise)) {}

  KvRef<KvObject> DeviceQuery(std::string_view question) override {
    if (question == "InverseDeviceID") return KvString::create("unit-0042");
    return otherwise_->DeviceQuery(question);
  }
  bool HasInternalDiagnostics(std::string_view subsystem) override {
    return otherwise_->HasInternalDiagnostics(subsystem);
  }
  std::string SMAOSVersion() override { return "Trailhead 4.2 (R1180)"; }
  KvRef<KvDictionary> copySystemVersionDictionary() override {
    return KvDictionary::create({{"ProductName", KvString::create("Trailhead")},
                                 {"ProductVersion", KvString::create("4.2")},
                                 {"ProductBuildVersion", KvString::create("R1180")}});
  }

 private:
  std::shared_ptr<DeviceInformation> otherwise_;
};

}  // namespace

int main(int count, char** arguments) {
  Platform services = makeHostPlatform(deviceRootFromEnvironment());
  services.deviceInformation = std::make_shared<ProductInformation>(services.deviceInformation);
  const PlatformScope scope(std::move(services));
  return runDailyJob(platform(), {arguments, static_cast<std::size_t>(count)});
}
