// The calls of SQLite on the store's files: a file system that asks before it passes a call on.
#include <sqlite3.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <utility>

#include "faults/disk.h"
#include "faults/fault.h"

namespace tally::faults {
namespace {

sqlite3_vfs* real() {
  static sqlite3_vfs* const unixFiles = ::sqlite3_vfs_find("unix");
  return unixFiles;
}

struct WatchedFile : sqlite3_file {
  const char* path;  // null for a temporary file; SQLite keeps it until the file is closed
  bool syncsName;    // with its first sync, as SQLite does for a journal that it makes
  sqlite3_file* inner() { return reinterpret_cast<sqlite3_file*>(this + 1); }
};

WatchedFile& watched(sqlite3_file* file) { return *static_cast<WatchedFile*>(file); }

template <class Call, class... Arguments>
int forward(Call sqlite3_io_methods::*method, sqlite3_file* file, Arguments... arguments) {
  sqlite3_file* const inner = watched(file).inner();
  return (inner->pMethods->*method)(inner, arguments...);
}

// Names of a store lead through the descriptor of its directory.
std::string realPath(const char* name) {
  const std::filesystem::path path(name), folder = path.parent_path();
  if (!folder.native().starts_with("/proc/self/fd/")) return name;
  return std::filesystem::read_symlink(folder) / path.filename();
}

bool fails(const char* call, const char* path, unsigned possible) {
  return path != nullptr && judge(call, realPath(path), possible) == Verdict::Fail;
}

std::string folderOf(const char* path) {
  return std::filesystem::path(realPath(path)).parent_path().native();
}

int read(sqlite3_file* file, void* bytes, int count, sqlite3_int64 offset) {
  if (fails("store: read", watched(file).path, kInputOutput)) return SQLITE_IOERR_READ;
  return forward(&sqlite3_io_methods::xRead, file, bytes, count, offset);
}

int write(sqlite3_file* file, const void* bytes, int count, sqlite3_int64 offset) {
  const char* const path = watched(file).path;
  const auto verdict = path == nullptr ? Verdict::Go
                                       : judge("store: write", realPath(path),
                                               kNoSpace | kInputOutput | kLastCall | kHalfWrite);
  if (verdict == Verdict::Fail) return faultCode() == ENOSPC ? SQLITE_FULL : SQLITE_IOERR_WRITE;
  if (path != nullptr) contentsChange(realPath(path));
  if (verdict == Verdict::KillHalfWay) {
    forward(&sqlite3_io_methods::xWrite, file, bytes, count / 2, offset);
    die();
  }
  return forward(&sqlite3_io_methods::xWrite, file, bytes, count, offset);
}

int truncate(sqlite3_file* file, sqlite3_int64 size) {
  if (fails("store: truncate", watched(file).path, kInputOutput | kLastCall)) {
    return SQLITE_IOERR_TRUNCATE;
  }
  if (watched(file).path != nullptr) contentsChange(realPath(watched(file).path));
  return forward(&sqlite3_io_methods::xTruncate, file, size);
}

int sync(sqlite3_file* file, int flags) {
  if (fails("store: sync", watched(file).path, kNoSpace | kInputOutput | kLastCall)) {
    return SQLITE_IOERR_FSYNC;
  }
  const int code = forward(&sqlite3_io_methods::xSync, file, flags);
  WatchedFile& self = watched(file);
  if (code != SQLITE_OK || self.path == nullptr) return code;
  contentsSynced(realPath(self.path));
  if (std::exchange(self.syncsName, false)) namesSynced(folderOf(self.path));
  return code;
}

int size(sqlite3_file* file, sqlite3_int64* result) {
  if (fails("store: size", watched(file).path, kInputOutput)) return SQLITE_IOERR_FSTAT;
  return forward(&sqlite3_io_methods::xFileSize, file, result);
}

int lock(sqlite3_file* file, int level) {
  if (fails("store: lock", watched(file).path, kInputOutput)) return SQLITE_IOERR_LOCK;
  return forward(&sqlite3_io_methods::xLock, file, level);
}

int mapShared(sqlite3_file* file, int region, int bytes, int extend, void volatile** mapped) {
  if (fails("store: map", watched(file).path,
            kInputOutput | kDenied | kLastCall | (extend != 0 ? kNoSpace : 0))) {
    return faultCode() == ENOSPC   ? SQLITE_IOERR_SHMSIZE
           : faultCode() == EACCES ? SQLITE_CANTOPEN
                                   : SQLITE_IOERR_SHMMAP;
  }
  return forward(&sqlite3_io_methods::xShmMap, file, region, bytes, extend, mapped);
}

int lockShared(sqlite3_file* file, int offset, int count, int flags) {
  const bool takes = (flags & SQLITE_SHM_LOCK) != 0;
  if (takes && fails("store: lock map", watched(file).path, kInputOutput)) {
    return SQLITE_IOERR_SHMLOCK;
  }
  return forward(&sqlite3_io_methods::xShmLock, file, offset, count, flags);
}

int close(sqlite3_file* file) { return forward(&sqlite3_io_methods::xClose, file); }

void barrier(sqlite3_file* file) {
  sqlite3_file* const inner = watched(file).inner();
  inner->pMethods->xShmBarrier(inner);
}

constexpr sqlite3_io_methods kMethods{
    .iVersion = 2,  // without mapped pages, which the store does not use
    .xClose = close,
    .xRead = read,
    .xWrite = write,
    .xTruncate = truncate,
    .xSync = sync,
    .xFileSize = size,
    .xLock = lock,
    .xUnlock = [](sqlite3_file* f,
                  int level) { return forward(&sqlite3_io_methods::xUnlock, f, level); },
    .xCheckReservedLock =
        [](sqlite3_file* f, int* result) {
          return forward(&sqlite3_io_methods::xCheckReservedLock, f, result);
        },
    .xFileControl =
        [](sqlite3_file* f, int operation, void* argument) {
          return forward(&sqlite3_io_methods::xFileControl, f, operation, argument);
        },
    .xSectorSize = [](sqlite3_file* f) { return forward(&sqlite3_io_methods::xSectorSize, f); },
    .xDeviceCharacteristics =
        [](sqlite3_file* f) { return forward(&sqlite3_io_methods::xDeviceCharacteristics, f); },
    .xShmMap = mapShared,
    .xShmLock = lockShared,
    .xShmBarrier = barrier,
    .xShmUnmap = [](sqlite3_file* f,
                    int remove) { return forward(&sqlite3_io_methods::xShmUnmap, f, remove); },
    .xFetch = nullptr,
    .xUnfetch = nullptr,
};

int open(sqlite3_vfs*, const char* path, sqlite3_file* file, int flags, int* opened) {
  const bool creates = (flags & SQLITE_OPEN_CREATE) != 0;
  file->pMethods = nullptr;
  if (fails(creates ? "store: create" : "store: open", path,
            kInputOutput | kDenied | kLastCall | (creates ? kNoSpace : 0))) {
    return SQLITE_CANTOPEN;
  }
  WatchedFile& self = watched(file);
  self.path = path;
  constexpr int kJournals = SQLITE_OPEN_WAL | SQLITE_OPEN_MAIN_JOURNAL | SQLITE_OPEN_SUPER_JOURNAL;
  self.syncsName = creates && (flags & kJournals) != 0;
  const NameChange change(NameChange::Kind::Create,
                          creates && path != nullptr ? realPath(path) : "");
  const int code = real()->xOpen(real(), path, self.inner(), flags, opened);
  change.done(code == SQLITE_OK ? 0 : -1);
  if (self.inner()->pMethods != nullptr) file->pMethods = &kMethods;
  return code;
}

int remove(sqlite3_vfs*, const char* path, int syncFolder) {
  if (fails("store: remove", path, kInputOutput | kDenied | kLastCall)) return SQLITE_IOERR_DELETE;
  const NameChange change(NameChange::Kind::Remove, realPath(path));
  const int code = real()->xDelete(real(), path, syncFolder);
  change.done(code == SQLITE_OK ? 0 : -1);
  if (code == SQLITE_OK && syncFolder != 0) namesSynced(folderOf(path));
  return code;
}

int access(sqlite3_vfs*, const char* path, int flags, int* result) {
  if (fails("store: access", path, kInputOutput | kDenied)) return SQLITE_IOERR_ACCESS;
  return real()->xAccess(real(), path, flags, result);
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

}  // namespace

void watchStore() {
  watchStoreMemory();
  static sqlite3_vfs watching = *real();
  watching.zName = "watched";
  watching.szOsFile = static_cast<int>(sizeof(WatchedFile)) + real()->szOsFile;
  watching.pNext = nullptr;
  watching.xOpen = open;
  watching.xDelete = remove;
  watching.xAccess = access;
  if (::sqlite3_vfs_register(&watching, 1) != SQLITE_OK) std::abort();
}

}  // namespace tally::faults
