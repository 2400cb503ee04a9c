// Interrupts by line and processor.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findInterrupts(const SystemTree& tree, Findings& findings);
void findSoftInterrupts(const SystemTree& tree, Findings& findings);

// /proc/interrupts and /proc/softirqs, a label for each line: the field of a line and column is
// that of the processor of this number, whatever column the text has it in.
void parseInterrupts(std::string_view text, const FileLayout& layout,
                     std::span<std::int64_t> fields);

}  // namespace tally
