// The process's name, protection against fatal signals, and reads and writes beyond files.
#pragma once

#include <cstddef>
#include <span>
#include <string>
#include <string_view>

#include "base/result.h"

namespace tally {

// The program's name without its folder.
std::string programName();
// The path of the running program's file, from the kernel.
Result<std::string> programFile();
int processID();
// Whether it runs with root's rights to files.
bool isRoot();
// From now on, writing to a closed pipe or beyond the process's file-size limit makes the call fail
// instead of ending the process. For programs only.
void surviveFailedWrites();
// One write call: how many bytes it took, or a negative number.
std::ptrdiff_t writeOnce(int descriptor, std::string_view bytes);
// One read call, repeated while signals interrupt it: how many bytes came, 0 at the end, or a
// negative number.
std::ptrdiff_t readOnce(int descriptor, std::span<char> bytes);

}  // namespace tally
