// Sleep: how often the machine slept, and what woke it.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findSuspend(const SystemTree& tree, Findings& findings);
void findWakeupSources(const SystemTree& tree, Findings& findings);

// What kind of device can wake the machine, by where it is and what it is called; one of a few
// words.
std::string_view wakeupKind(std::string_view path, std::string_view name);

}  // namespace tally
