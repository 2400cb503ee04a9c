// Other programs that are started.
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

// Starts a program of the directory that this one is in, without waiting for its end, of which
// nobody is told. It begins with no signal blocked. The first word is its name there.
Status startInBackground(std::span<const std::string> words);

}  // namespace tally
