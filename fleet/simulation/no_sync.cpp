// Nothing here outlives a power cut, and need not: the devices are made again. The program and
// SQLite both call what the program defines under these names, so no device waits for a disk, and
// the programs of devices need no switch for it.
#include <unistd.h>

#define SHOWN __attribute__((visibility("default")))

extern "C" {
SHOWN int fsync(int) { return 0; }
SHOWN int fdatasync(int) { return 0; }
SHOWN int syncfs(int) noexcept { return 0; }
}
