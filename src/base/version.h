// The version of the programs and libraries.
#pragma once

#include <string_view>

namespace tally {

// The version of the project in CMakeLists.txt: "0.1.0".
extern const std::string_view kProgramVersion;

}  // namespace tally
