// Which of the kernel's sources a device has, and what keeps the others from being read.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "host/tree/system_tree.h"

namespace tally {

struct SourceSurvey {
  std::string_view title;
  std::size_t channels = 0;
  std::size_t refused = 0;  // files that the user may not read
  std::string example;      // one of them
};

// Reads every file once. Sources that share a name are one, in the order of the table.
std::vector<SourceSurvey> surveySources(const SystemTree& tree);

}  // namespace tally
