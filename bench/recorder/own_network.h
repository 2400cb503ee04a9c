// A network of the benchmark's own, where it may set what all sockets of a machine share.
#pragma once

namespace tally::bench {

// Has this process, and those it starts, use a network with nothing but a loopback device. False,
// with the machine's own network kept, when that is not permitted: it takes root.
bool enterOwnNetwork();

// How many datagrams a UNIX socket queues that is made from now on.
int queueLength();
// REQUIRES: enterOwnNetwork().
void setQueueLength(int datagrams);

}  // namespace tally::bench
