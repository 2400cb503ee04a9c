// Compressed memory disks.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

// From /sys/block/zram*/mm_stat and bd_stat, which are lines of numbers in the order of the table's
// rows; older kernels have fewer.
void findZram(const SystemTree& tree, Findings& findings);

}  // namespace tally
