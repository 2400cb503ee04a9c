// What a library may ask of its own process, and the one write that is not to a file.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace tally {

// The program's name without its folder.
std::string programName();
int processID();
// One write call: how many bytes it took, or a negative number.
std::ptrdiff_t writeOnce(int descriptor, std::string_view bytes);

}  // namespace tally
