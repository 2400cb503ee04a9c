// Code of a program that lies in a file of its own, and is loaded by the runs that need it.
#pragma once

#include <string>

#include "base/result.h"

namespace tally {

// The function of that name in lib/tallyrun/MODULE beside the directory of the program's file. The
// environment cannot choose another file. An error if a user who cannot write the program's file
// can write the module's. Once loaded, it stays.
Result<void*> functionOfModule(const std::string& program, const std::string& module,
                               const char* function);

}  // namespace tally
