// What a library may ask of its own process, how a program stays alive, and the one write that is
// not to a file.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tally {

// The program's name without its folder.
std::string programName();
int processID();
// Writing to a closed pipe, and beyond the largest file that the process may write, is from now on
// an error of the call and no longer the end of the process. For programs only.
void surviveFailedWrites();
// One write call: how many bytes it took, or a negative number.
std::ptrdiff_t writeOnce(int descriptor, std::string_view bytes);

}  // namespace tally
