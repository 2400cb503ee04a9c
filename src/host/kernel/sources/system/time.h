// How long the machine runs, and what time it is.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findTime(const SystemTree& tree, Findings& findings);

// /proc/uptime, in milliseconds.
void parseUptime(std::string_view text, const FileLayout&, std::span<std::int64_t> fields);

}  // namespace tally
