// SQLite's calls. The program opens and removes the store's files itself; for its other calls,
// SQLite is given functions.
#include <fcntl.h>
#include <sqlite3.h>

#include <cerrno>
#include <cstdlib>

#include "faults/fault.h"

extern "C" {
int __wrap_close(int);
ssize_t __wrap_read(int, void*, size_t);
ssize_t __wrap_pread(int, void*, size_t, off_t);
ssize_t __wrap_write(int, const void*, size_t);
ssize_t __wrap_pwrite(int, const void*, size_t, off_t);
int __wrap_ftruncate(int, off_t);
int __wrap_fstat(int, struct stat*);
}

namespace tally::faults {
namespace {

int lock(int file, int command, void* argument) {
  const bool takes = command == F_SETLK && static_cast<struct flock*>(argument)->l_type != F_UNLCK;
  // On the shared map SQLite treats any failure as a lock of another process, and waits.
  if (takes && !pathOf(file).ends_with("-shm") &&
      judge("lock", pathOf(file), kInputOutput) == Verdict::Fail) {
    errno = faultCode();
    return -1;
  }
  return ::fcntl(file, command, argument);
}

// Before SQLite is used for the first time.
void watchStoreMemory() {
  static sqlite3_mem_methods memory;
  if (::sqlite3_config(SQLITE_CONFIG_GETMALLOC, &memory) != SQLITE_OK) std::abort();
  static const sqlite3_mem_methods system = memory;
  memory.xMalloc = [](int bytes) {
    return memoryRunsOut("store: allocation") ? nullptr : system.xMalloc(bytes);
  };
  memory.xRealloc = [](void* old, int bytes) {
    return memoryRunsOut("store: allocation") ? nullptr : system.xRealloc(old, bytes);
  };
  if (::sqlite3_config(SQLITE_CONFIG_MALLOC, &memory) != SQLITE_OK) std::abort();
}

template <class Call>
void replace(const char* name, Call* call) {
  sqlite3_vfs* const files = ::sqlite3_vfs_find("unix");
  if (files->xSetSystemCall(files, name, reinterpret_cast<sqlite3_syscall_ptr>(call)) !=
      SQLITE_OK) {
    std::abort();
  }
}

}  // namespace

void watchStore() {
  watchStoreMemory();
  replace("close", __wrap_close);
  replace("read", __wrap_read);
  replace("pread", __wrap_pread);
  replace("pread64", __wrap_pread);
  replace("write", __wrap_write);
  replace("pwrite", __wrap_pwrite);
  replace("pwrite64", __wrap_pwrite);
  replace("ftruncate", __wrap_ftruncate);
  replace("fstat", __wrap_fstat);
  replace("fcntl", lock);
}

}  // namespace tally::faults
