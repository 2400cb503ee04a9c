// Purgeable space from the device description; Linux has no such service.
#pragma once

#include <memory>

#include "host/described/device_description.h"
#include "platform/purgeable_space.h"

namespace tally {

class DescribedPurgeableSpace final : public PurgeableSpace {
 public:
  explicit DescribedPurgeableSpace(std::shared_ptr<DeviceDescription> description)
      : description_(std::move(description)) {}
  bool isAvailable() override { return described() != nullptr; }
  KvRef<KvDictionary> copyItemizedPurgeableSpace(const KvDictionary&) override {
    const auto* answer = described();
    return answer != nullptr ? answer->copy() : nullptr;
  }

 private:
  const KvDictionary* described() {
    return description_->getAs<KvDictionary>(Described::PurgeableSpace);
  }

  std::shared_ptr<DeviceDescription> description_;
};

}  // namespace tally
