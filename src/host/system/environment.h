// The variables of the process's environment.
#pragma once

#include <cstdlib>
#include <string>

namespace tally {

// Empty when the variable is unset.
inline std::string environmentVariable(const char* name) {
  const char* const value = std::getenv(name);
  return value != nullptr ? value : "";
}

// TALLYRUN_ROOT; "/" when it is unset or empty.
inline std::string deviceRootFromEnvironment() {
  const std::string root = environmentVariable("TALLYRUN_ROOT");
  return root.empty() ? "/" : root;
}

}  // namespace tally
