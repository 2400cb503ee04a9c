// Thermal zones and the devices that cool them.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findThermalZones(const SystemTree& tree, Findings& findings);
void findCoolingDevices(const SystemTree& tree, Findings& findings);

}  // namespace tally
