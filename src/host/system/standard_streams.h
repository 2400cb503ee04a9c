// The three standard streams of a program that others start, however they left them.
#pragma once

namespace tally {

// Keeps the next file that is opened from getting the descriptor of a closed standard stream;
// writing to such a stream fails.
void prepareStandardStreams();

}  // namespace tally
