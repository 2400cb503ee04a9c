// Batteries and mains.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findPowerSupplies(const SystemTree& tree, Findings& findings);

// Of /sys/class/power_supply: microwatt hours, tenths of degrees, and cycles, of which none means
// that the battery does not count them.
void parseEnergy(std::string_view text, const FileLayout&, std::span<std::int64_t> fields);
void parseTenths(std::string_view text, const FileLayout&, std::span<std::int64_t> fields);
void parseCycles(std::string_view text, const FileLayout&, std::span<std::int64_t> fields);

}  // namespace tally
