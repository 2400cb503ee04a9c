// Network interfaces.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findInterfaces(const SystemTree& tree, Findings& findings);

// /proc/net/dev, a label for each interface. The numbers may follow a name's colon at once.
void parseInterfaces(std::string_view text, const FileLayout& layout,
                     std::span<std::int64_t> fields);

}  // namespace tally
