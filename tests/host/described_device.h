// A device folder, with the registry that it describes.
#pragma once

#include <memory>
#include <string_view>

#include "fakes/fake_platform.h"
#include "fakes/temporary_folder.h"
#include "host/described/registry_description.h"
#include "host/registry/source_registry.h"

namespace tally::tests {

class DescribedDevice : public TemporaryFolder {
 public:
  explicit DescribedDevice(std::string_view body) {
    putPlist("registry.plist", body);
    std::vector<std::unique_ptr<RegistrySource>> sources;
    sources.push_back(std::make_unique<RegistryDescription>(DeviceDirectory(root, ""), log_));
    registry_ = std::make_unique<SourceRegistry>(std::move(sources));
  }
  ConnectionHandle connect(std::string_view className) const {
    const RegistryHandle service =
        registry_->RegistryFindService(ServiceMatchingByClass(className));
    ConnectionHandle connection = 0;
    registry_->ServiceOpenConnection(service, 0, &connection);
    registry_->HandleRelease(service);
    return connection;
  }
  DeviceRegistry& registry() const { return *registry_; }
  std::size_t openHandles() const { return registry_->openHandles(); }
  std::size_t errors() const { return log_->texts(LogLevel::Error).size(); }

 private:
  std::shared_ptr<fakes::FakeSystemLog> log_ = std::make_shared<fakes::FakeSystemLog>();
  std::unique_ptr<SourceRegistry> registry_;
};

}  // namespace tally::tests
