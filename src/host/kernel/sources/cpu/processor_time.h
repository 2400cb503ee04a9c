// What the processors spent their time on, and the events that the kernel counts beside it.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findProcessorTime(const SystemTree& tree, Findings& findings);

// /proc/stat. Times become milliseconds.
void parseProcessorTime(std::string_view text, const FileLayout& layout,
                        std::span<std::int64_t> fields);

}  // namespace tally
