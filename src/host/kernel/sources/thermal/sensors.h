// Hardware monitors: temperatures, fans, voltages, currents, power.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findSensors(const SystemTree& tree, Findings& findings);

}  // namespace tally
