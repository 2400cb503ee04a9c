// Processors: their idle states, frequencies and throttling.
#pragma once

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

void findIdleStates(const SystemTree& tree, Findings& findings);
void findFrequencies(const SystemTree& tree, Findings& findings);
void findThrottling(const SystemTree& tree, Findings& findings);

// cpufreq/stats/time_in_state: a label for each frequency. Milliseconds.
void parseTimeInFrequency(std::string_view text, const FileLayout& layout,
                          std::span<std::int64_t> fields);

}  // namespace tally
