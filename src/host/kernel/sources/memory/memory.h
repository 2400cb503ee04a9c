// Memory: what is free, and how it moves between storage and processes.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

// Of /proc/meminfo.
void findMemory(const SystemTree& tree, Findings& findings);
// Of /proc/vmstat.
void findPaging(const SystemTree& tree, Findings& findings);

}  // namespace tally
