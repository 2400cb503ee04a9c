// Time in which work waited for the processor, memory, storage or interrupts.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findPressure(const SystemTree& tree, Findings& findings);

// /proc/pressure/*: the totals of the lines that the labels name.
void parsePressure(std::string_view text, const FileLayout& layout, std::span<std::int64_t> fields);

}  // namespace tally
