// A device root with the files of a large machine's kernel, for benchmarks.
#pragma once

#include <string>

namespace tally::bench {

// 64 processors, 20 disks, 30 network interfaces, sensors; below a folder that exists.
void makeKernelTree(const std::string& root);

}  // namespace tally::bench
