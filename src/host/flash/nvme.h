// NVMe: the SMART / health page, which a program of its own leaves in a file.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>

#include "base/files/device_root.h"
#include "host/tree/system_tree.h"
#include "platform/flash/wear.h"

namespace tally {

// Empty unless it has the length of a page and is not blank.
std::optional<Wear> parseHealthPage(std::span<const std::byte> page);

// The controller of a namespace: "nvme0" for "nvme0n1". Empty if there is none.
std::string nvmeController(const SystemTree& tree, const std::string& name);

// The page of a controller, and when it was read, in seconds since 1970.
struct HealthPage {
  std::optional<Wear> wear;
  std::int64_t readAt = 0;
};
HealthPage readHealthPage(const DeviceRoot& root, const std::string& controller);
bool hasHealthPage(const DeviceRoot& root, const std::string& controller);

std::string nvmeIdentity(const SystemTree& tree, const std::string& name);

}  // namespace tally
