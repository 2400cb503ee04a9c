// Stackshots from the device description; Linux itself takes none.
#pragma once

#include <memory>
#include <string>

#include "base/files/device_root.h"
#include "host/described/device_description.h"
#include "platform/stackshot.h"

namespace tally {

class DescribedStackshot final : public Stackshot {
 public:
  // folder has the files that the description names.
  DescribedStackshot(DeviceDirectory folder, std::shared_ptr<DeviceDescription> description)
      : folder_(std::move(folder)), description_(std::move(description)) {}
  std::unique_ptr<StackshotConfig> stackshotConfigCreate() override;

 private:
  DeviceDirectory folder_;
  std::shared_ptr<DeviceDescription> description_;
};

}  // namespace tally
