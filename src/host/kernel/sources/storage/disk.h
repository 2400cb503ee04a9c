// Block devices.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findDisks(const SystemTree& tree, Findings& findings);

// /sys/block/*/stat, in the order of the table's rows. Sectors of 512 bytes become KiB.
void parseDiskStatistics(std::string_view text, const FileLayout& layout,
                         std::span<std::int64_t> fields);

}  // namespace tally
