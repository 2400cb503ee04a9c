// Errors that memory controllers corrected, and those that they could not.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findMemoryErrors(const SystemTree& tree, Findings& findings);

}  // namespace tally
