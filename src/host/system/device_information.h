// What the device says of itself: its description, else Linux.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "host/described/device_description.h"
#include "platform/device_information.h"

namespace tally {

class LinuxDeviceInformation final : public DeviceInformation {
 public:
  LinuxDeviceInformation(DeviceRoot root, std::shared_ptr<DeviceDescription> description)
      : root_(std::move(root)), description_(std::move(description)) {}
  KvRef<KvObject> DeviceQuery(std::string_view question) override;
  bool HasInternalDiagnostics(std::string_view subsystem) override;
  std::string SMAOSVersion() override;
  KvRef<KvDictionary> copySystemVersionDictionary() override;

 private:
  KvRef<KvObject> diskUsage() const;
  KvRef<KvObject> inverseDeviceID() const;

  DeviceRoot root_;
  std::shared_ptr<DeviceDescription> description_;
};

// A directory on the volume that holds what is recorded: the home of the program's user, or the
// nearest one above it that is there. The root's own volume is often read-only.
Result<Directory> openDataVolume(const DeviceRoot& root);

// An identifier that is stable for a machine and does not reveal its machine id, of which it is a
// hash: 32 hexadecimal digits. Empty when the text holds no machine id.
std::string inverseDeviceID(std::string_view machineId);

}  // namespace tally
