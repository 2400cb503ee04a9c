// A program that runs in the place of this one.
#pragma once

#include <span>
#include <string>

#include "base/result.h"

namespace tally {

// Runs a program, found as a shell finds it, with this one's standard streams, and waits for its
// end. The signals that a terminal sends to both are the program's alone meanwhile. Returns the
// status as shells do: what it exited with, or 128 and the number of the signal that ended it. An
// error, with its code: it was not started. REQUIRES: there is at least one word.
Result<int> runInForeground(std::span<const std::string> words);

}  // namespace tally
