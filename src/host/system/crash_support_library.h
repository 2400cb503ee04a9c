// The crash-reporting support library of this platform.
#pragma once

#include <memory>
#include <string_view>
#include <utility>

#include "host/described/device_description.h"
#include "platform/crash_support_library.h"

namespace tally {

// The support library is part of this platform, whatever the path, unless the device description
// says otherwise: "CrashSupport" = { "Absent" = true, "MissingSymbols" = [names] }.
class LinuxCrashSupportLibrary final : public CrashSupportLibrary {
 public:
  explicit LinuxCrashSupportLibrary(std::shared_ptr<DeviceDescription> description)
      : description_(std::move(description)) {}
  bool open(std::string_view path) override;
  bool hasSymbol(std::string_view name) override;

 private:
  std::shared_ptr<DeviceDescription> description_;
};

}  // namespace tally
