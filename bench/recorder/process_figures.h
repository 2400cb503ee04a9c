// What a running process takes, by the kernel's accounting of it.
#pragma once

#include <sys/types.h>

namespace tally::bench {

// CPU time of all threads, in seconds.
struct CpuTimes {
  double user = 0, system = 0;
  double sum() const { return user + system; }
};
CpuTimes operator-(const CpuTimes& a, const CpuTimes& b);
CpuTimes cpuTimesOf(pid_t process);

// Pages that no other process shares, in KiB: written ones, and ones of files that nobody else has
// mapped, which the kernel may drop at any time.
struct PrivateMemory {
  long clean = 0, dirty = 0;
  long sum() const { return clean + dirty; }
};
PrivateMemory privateMemoryOf(pid_t process);

}  // namespace tally::bench
