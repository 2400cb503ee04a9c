// Purgeable space from the device description; Linux has no such service.
#pragma once

#include <memory>

#include "platform/linux/device_description.h"
#include "platform/purgeable_space.h"

namespace tally {

class DescribedPurgeableSpace final : public PurgeableSpace {
 public:
  explicit DescribedPurgeableSpace(std::shared_ptr<DeviceDescription> description)
      : description_(std::move(description)) {}
  bool isAvailable() override { return description_->get(kEntry) != nullptr; }
  KvRef<KvDictionary> copyItemizedPurgeableSpace(const KvDictionary&) override {
    const auto* answer = description_->getAs<KvDictionary>(kEntry);
    return answer != nullptr ? answer->copy() : nullptr;
  }

 private:
  static constexpr std::string_view kEntry = "PurgeableSpace";
  std::shared_ptr<DeviceDescription> description_;
};

}  // namespace tally
