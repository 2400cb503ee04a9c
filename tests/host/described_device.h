// A device folder of a test's own, with the registry that it describes.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "host/described/registry_description.h"
#include "host/described/source_registry.h"

namespace tally::tests {

inline std::string plist(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?><plist version=\"1.0\">" + std::string(body) +
         "</plist>";
}

class DescribedDevice {
 public:
  // body is the content of the property list; null leaves the device undescribed.
  explicit DescribedDevice(const char* body) {
    char name[] = "/tmp/tally-device-XXXXXX";
    folder_ = mkdtemp(name);
    if (body != nullptr) describe(body);
    std::vector<std::unique_ptr<RegistrySource>> sources;
    sources.push_back(std::make_unique<RegistryDescription>(DeviceDirectory(folder_, ""), log_));
    registry_ = std::make_unique<SourceRegistry>(std::move(sources));
  }
  ~DescribedDevice() { std::filesystem::remove_all(folder_); }

  // Replaces the description, as an editor does: with a new file.
  void describe(std::string_view body) {
    write("registry.new", plist(body));
    std::filesystem::rename(folder_ + "/registry.new", folder_ + "/registry.plist");
  }
  void write(const std::string& name, std::string_view content) const {
    std::ofstream(folder_ + "/" + name, std::ios::binary) << content;
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
  std::size_t errors() const { return log_->errors; }

 private:
  struct CountingLog final : SystemLog {
    CountingLog() : SystemLog(Repeats::All) {}
    bool enabled(LogLevel) const override { return true; }
    void write(LogLevel level, std::string_view) override { errors += level == LogLevel::Error; }
    std::size_t errors = 0;
  };
  std::string folder_;
  std::shared_ptr<CountingLog> log_ = std::make_shared<CountingLog>();
  std::unique_ptr<SourceRegistry> registry_;
};

}  // namespace tally::tests
