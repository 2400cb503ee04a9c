// What a whole process costs, by the kernel's own accounting of it.
#pragma once

#include <string>
#include <vector>

namespace tally::bench {

struct ProcessCost {
  double wallSeconds = 0;
  double cpuSeconds = 0;   // user and system
  long peakKibibytes = 0;  // largest resident size
  int exitStatus = -1;     // -1 when it could not be started or was killed
};

// Runs a program with further environment entries ("NAME=value"); its output is thrown away.
ProcessCost runProcess(const std::vector<std::string>& command,
                       const std::vector<std::string>& environment = {});

// The run with the median wall time of several, after one that is not counted.
ProcessCost medianRun(int runs, const std::vector<std::string>& command,
                      const std::vector<std::string>& environment = {});

}  // namespace tally::bench
