// What the header of a text log says: the device's description, else Linux.
#pragma once

#include <memory>
#include <string>

#include "host/described/device_description.h"
#include "host/tree/system_tree.h"
#include "platform/device_information.h"
#include "platform/log_header_facts.h"

namespace tally {

class LinuxLogHeaderFacts final : public LogHeaderFacts {
 public:
  LinuxLogHeaderFacts(std::shared_ptr<DeviceInformation> device,
                      std::shared_ptr<DeviceDescription> description,
                      std::shared_ptr<const SystemTree> tree)
      : device_(std::move(device)), description_(std::move(description)), tree_(std::move(tree)) {}
  std::string SysIdDescription() override;
  std::string HardwareModelString() override;
  std::string SystemVersionString() override;
  std::string NewIncidentID() override;
  std::string processName() override;
  std::int32_t processIdentifier() override;

 private:
  // The described text, else the other one; on one line.
  std::string describedOr(DescribedAs<KvString> entry, const std::string& text);

  std::shared_ptr<DeviceInformation> device_;
  std::shared_ptr<DeviceDescription> description_;
  std::shared_ptr<const SystemTree> tree_;
};

}  // namespace tally
