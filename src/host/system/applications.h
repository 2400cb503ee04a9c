// Installed applications: XDG desktop entries.
#pragma once

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "host/described/device_description.h"
#include "platform/applications.h"

namespace tally {

// Folders of desktop entries: if an id is in several folders, the first one takes precedence.
struct ApplicationFolder {
  DeviceDirectory directory;
  std::string_view bundleType;
};

// The folders of a device, the user's first. dataHome is the value of XDG_DATA_HOME or its default;
// empty when the program's own user has no part in the device.
std::vector<ApplicationFolder> applicationFolders(const DeviceRoot& root,
                                                  const std::string& dataHome);

// The bundles are those of the description's "Applications" (an array of bundle types), else one
// for each application with a visible desktop entry.
class DesktopAppRegistry final : public AppRegistry {
 public:
  DesktopAppRegistry(std::vector<ApplicationFolder> folders,
                     std::shared_ptr<DeviceDescription> description)
      : folders_(std::move(folders)), description_(std::move(description)) {}
  void enumerateBundles(int kind, const std::function<void(std::string_view)>& handler) override;

 private:
  std::vector<ApplicationFolder> folders_;
  std::shared_ptr<DeviceDescription> description_;
};

// True when a desktop entry is an application that is to be shown.
bool isVisibleApplication(std::string_view desktopEntry);

}  // namespace tally
