// Other programs that are started.
#pragma once

#include <chrono>
#include <span>
#include <string>

#include "base/result.h"

namespace tally {

// Runs a program, found as a shell finds it, with this one's standard streams, and waits for its
// end. The signals that a terminal sends to both are the program's alone meanwhile. Returns the
// status as shells do: what it exited with, or 128 and the number of the signal that ended it. An
// error, with its code: it was not started. REQUIRES: there is at least one word.
Result<int> runInForeground(std::span<const std::string> words);

// Runs the program of an open file in a process group of its own, without standard input, with this
// environment alone and none of this process's rights beyond its user's, and waits for its end.
// Whatever of the group is left then, or at the limit, is killed. Returns the status as above; an
// error if it was not started or has not ended within the limit. A program that cannot be executed
// ends with 126. REQUIRES: this process has one thread, and there is at least one word.
Result<int> runWithLimit(int program, std::span<const std::string> words,
                         std::span<const std::string> environment, std::chrono::milliseconds limit);

// Starts a program of the directory that this one is in, without waiting for its end, of which
// nobody is told. It begins with no signal blocked. The first word is its name there.
Status startInBackground(std::span<const std::string> words);

}  // namespace tally
