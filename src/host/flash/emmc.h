// eMMC: the life that the card's extended registers report.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "host/tree/system_tree.h"
#include "platform/flash/wear.h"

namespace tally {

// The attributes of a card, as their files have them; absent ones are empty.
struct EmmcAttributes {
  std::string_view type, revision, lifeTime, preEndOfLife;
};
// Empty where the card is not an eMMC of revision 7 or later, or says nothing.
std::optional<Wear> parseEmmc(const EmmcAttributes& attributes);
// The extended registers in hexadecimal, as the kernel's debug file has them.
std::optional<Wear> parseExtendedRegisters(std::string_view hexadecimal);

// Of a block device such as "mmcblk0". The attributes are as old as the boot, and the wear says so;
// registers read afresh come first where they may be read.
std::optional<Wear> readEmmc(const SystemTree& tree, const std::string& name);
std::string emmcIdentity(const SystemTree& tree, const std::string& name);

}  // namespace tally
