// The three standard streams of a program that others start, however they left them.
#pragma once

namespace tally {

// Keeps the numbers of streams that are closed from going to the next file that is opened: writing
// to such a stream fails.
void prepareStandardStreams();

}  // namespace tally
