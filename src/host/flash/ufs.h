// UFS: the health descriptor of the host controller.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "host/tree/system_tree.h"
#include "platform/flash/wear.h"

namespace tally {

// The attributes of the descriptor, as their files have them; one that could not be read is empty.
struct UfsHealth {
  std::string_view endOfLife, lifeTimeA, lifeTimeB;
};
std::optional<Wear> parseUfs(const UfsHealth& health);

// The folder of the controller that the block device belongs to; empty if it is not of a UFS disk.
std::string ufsController(const SystemTree& tree, const std::string& name);
// Wakes the disk. A busy one says nothing.
std::optional<Wear> readUfs(const SystemTree& tree, const std::string& controller);
std::string ufsIdentity(const SystemTree& tree, const std::string& controller);

}  // namespace tally
