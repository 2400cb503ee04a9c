// What the device says of itself.
#pragma once

#include <string>
#include <string_view>

#include "kv/value.h"

namespace tally {

// Entries of the answer to "DiskUsage", in bytes.
constexpr std::string_view kDOQDiskUsageTotalDiskCapacity = "TotalDiskCapacity";
constexpr std::string_view kDOQDiskUsageTotalDataAvailable = "TotalDataAvailable";

class DeviceInformation {
 public:
  virtual ~DeviceInformation() = default;
  // The answer to a question key ("DiskUsage", "InternalBuild", "ConfigNumber",
  // "InverseDeviceID"); null when the device has none.
  virtual KvRef<KvObject> DeviceQuery(std::string_view question) = 0;
  // True on an internal-diagnostics build, for the given subsystem.
  virtual bool HasInternalDiagnostics(std::string_view subsystem) = 0;
  // The running system's version, as logs carry it; never empty.
  virtual std::string SMAOSVersion() = 0;
  // "ProductName", "ProductVersion", "ProductBuildVersion"; what is not known is absent.
  virtual KvRef<KvDictionary> copySystemVersionDictionary() = 0;
};

}  // namespace tally
