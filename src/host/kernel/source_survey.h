// Which of the kernel's sources a device has, and what keeps the others from being read.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "host/tree/system_tree.h"

namespace tally {

struct UnreadableFiles {
  std::size_t count = 0;
  std::string example;  // the first of them
  int error = 0;        // its errno
};

struct SourceSurvey {
  std::string_view title;
  std::size_t channels = 0;  // without those of broken files
  UnreadableFiles refused;   // that the user may not read
  UnreadableFiles broken;    // that are there but cannot be opened by anyone; EOPNOTSUPP: that are
                             // switched off
};

// Reads every file once. Sources that share a name are one, in the order of the table.
std::vector<SourceSurvey> surveySources(const SystemTree& tree);

}  // namespace tally
