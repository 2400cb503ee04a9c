#include "host/store/store_files.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <list>
#include <mutex>
#include <new>
#include <optional>
#include <utility>

#include "base/files/file.h"
#include "base/number_text.h"

namespace tally {
namespace {

// Where the kernel shows open descriptors, so that a name also leads to its file for whoever does
// not know of this file system: a debugger, or a system call that another user of SQLite reset.
constexpr std::string_view kDescriptors = "/proc/self/fd/";
constexpr std::string_view kBesideDatabase[] = {"", "-wal", "-shm", "-journal"};

thread_local std::string refusal;

struct Store {
  Directory directory;
  std::string database;
};

// Never emptied, so that what is found stays.
class Stores {
 public:
  int add(const Directory& directory, std::string_view database) {
    struct stat wanted {};
    if (::fstat(directory.descriptor(), &wanted) != 0) return -1;
    const std::lock_guard lock(mutex_);
    for (const Store& store : stores_) {
      struct stat held {};
      if (store.database == database && ::fstat(store.directory.descriptor(), &held) == 0 &&
          held.st_dev == wanted.st_dev && held.st_ino == wanted.st_ino) {
        return store.directory.descriptor();
      }
    }
    stores_.push_back({directory, std::string(database)});
    return directory.descriptor();
  }

  const Store* find(int descriptor, std::string_view file) {
    const std::lock_guard lock(mutex_);
    for (const Store& store : stores_) {
      if (store.directory.descriptor() != descriptor) continue;
      if (file.empty()) return &store;
      if (!file.starts_with(store.database)) continue;
      for (const std::string_view end : kBesideDatabase) {
        if (file.substr(store.database.size()) == end) return &store;
      }
    }
    return nullptr;
  }

 private:
  std::mutex mutex_;
  std::list<Store> stores_;
};

Stores& stores() {
  static Stores& all = *new Stores;  // connections may outlive static objects
  return all;
}

// A file of a store, or its directory, whose file name is empty.
struct Place {
  const Store* store;
  const char* file;
  int descriptor() const { return store->directory.descriptor(); }
};

std::optional<Place> placeOf(const char* path) {
  if (path == nullptr || !std::string_view(path).starts_with(kDescriptors)) return std::nullopt;
  const std::string_view rest = std::string_view(path).substr(kDescriptors.size());
  const auto slash = std::min(rest.find('/'), rest.size());
  const auto number = parseInt64(rest.substr(0, slash));
  if (!number) return std::nullopt;
  const std::string_view file = rest.substr(std::min(slash + 1, rest.size()));
  const Store* const store = stores().find(static_cast<int>(*number), file);
  if (store == nullptr) return std::nullopt;
  return Place{store, file.data()};
}

// The system calls of SQLite's own file system, by which names of stores go through their directory
// and all others as before.

using OpenCall = int (*)(const char*, int, int);
// A struct stat has two sizes on 32-bit systems, by the time that a library was built with: only
// SQLite's own calls may fill SQLite's.
using StatCall = int (*)(const char*, void*);
using FstatCall = int (*)(int, void*);
using UnlinkCall = int (*)(const char*);
OpenCall formerOpen;
StatCall formerStat;
FstatCall sqliteFstat;
UnlinkCall formerUnlink;

int refuse(int file, int code) {
  if (file >= 0) ::close(file);
  errno = code;
  return -1;
}

int openFile(const char* path, int flags, int mode) {
  const auto place = placeOf(path);
  if (!place) return formerOpen(path, flags, mode);
  const Directory& directory = place->store->directory;
  if (*place->file == '\0') {
    return ::openat(directory.descriptor(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  }
  const int file = ::openat(directory.descriptor(), place->file,
                            flags | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC, mode);
  const int code = errno;
  try {
    if (file >= 0) {
      const auto checked = directory.check(file, place->file);
      if (checked) return file;
      refusal = checked.error().message;
      return refuse(file, EPERM);
    }
    if (code == ELOOP) {
      refusal = directory.pathOf(place->file) + " is a symbolic link, which is not followed";
    } else if (code == ENXIO || code == EISDIR) {
      refusal = directory.pathOf(place->file) + " is not a regular file";
    }
    return refuse(-1, code);
  } catch (const std::bad_alloc&) {  // which must not pass through SQLite
    return refuse(file, ENOMEM);
  }
}

int statFile(const char* path, void* status) {
  const auto place = placeOf(path);
  if (!place) return formerStat(path, status);
  // Without opening the file itself: closing it would drop the locks that this process holds on it.
  const Descriptor named(retried(
      [&] { return ::openat(place->descriptor(), place->file, O_PATH | O_NOFOLLOW | O_CLOEXEC); }));
  return named ? sqliteFstat(named.get(), status) : -1;
}

int unlinkFile(const char* path) {
  const auto place = placeOf(path);
  if (!place) return formerUnlink(path);
  return ::unlinkat(place->descriptor(), place->file, 0);
}

template <class Call>
bool replaceCall(sqlite3_vfs& system, const char* name, Call& former, Call call) {
  const auto found = system.xGetSystemCall(&system, name);
  if (found == nullptr) return false;
  former = reinterpret_cast<Call>(found);
  return system.xSetSystemCall(&system, name, reinterpret_cast<sqlite3_syscall_ptr>(call)) ==
         SQLITE_OK;
}

// The file system that is SQLite's default, for names of stores alone. A journal may name another,
// which SQLite would read, and remove when it is done.

sqlite3_vfs* base() {
  static sqlite3_vfs* const found = ::sqlite3_vfs_find(nullptr);
  return found;
}

// SQLite syncs a log's header before the frames after it, because a former header with some of the
// new frames could make former frames valid again. A log that holds nothing but a header has no
// former frames: its first commit syncs both, and a commit of the file system's journal is saved.
// The blocks of a log that was removed are used again only once the removal is durable.
constexpr sqlite3_int64 kLogHeaderBytes = 32;
int (*formerSync)(sqlite3_file*, int);

int syncLog(sqlite3_file* file, int flags) {
  sqlite3_int64 size = 0;
  const int code = file->pMethods->xFileSize(file, &size);
  if (code == SQLITE_OK && size <= kLogHeaderBytes) return SQLITE_OK;
  return formerSync(file, flags);
}

// The calls on a log, which is always opened the same way.
const sqlite3_io_methods* logMethods(const sqlite3_io_methods* former) {
  static const sqlite3_io_methods ours = [former] {
    sqlite3_io_methods methods = *former;
    formerSync = methods.xSync;
    methods.xSync = syncLog;
    return methods;
  }();
  return former->xSync == formerSync ? &ours : former;
}

int open(sqlite3_vfs*, const char* path, sqlite3_file* file, int flags, int* opened) {
  file->pMethods = nullptr;
  if (path != nullptr && !placeOf(path)) return SQLITE_CANTOPEN;
  const int code = base()->xOpen(base(), path, file, flags, opened);
  if (code == SQLITE_OK && (flags & SQLITE_OPEN_WAL) != 0)
    file->pMethods = logMethods(file->pMethods);
  return code;
}

int remove(sqlite3_vfs*, const char* path, int syncDirectory) {
  if (!placeOf(path)) return SQLITE_IOERR_DELETE;
  return base()->xDelete(base(), path, syncDirectory);
}

// SQLite's own treats a journal that it cannot examine as absent, and would use a half-written
// store.
int access(sqlite3_vfs*, const char* path, int flags, int* result) {
  *result = 0;
  const auto place = placeOf(path);
  if (!place) return SQLITE_OK;
  if (flags != SQLITE_ACCESS_EXISTS) {
    *result = ::faccessat(place->descriptor(), place->file, R_OK | W_OK, 0) == 0;
    return SQLITE_OK;
  }
  struct stat status {};
  if (::fstatat(place->descriptor(), place->file, &status, AT_SYMLINK_NOFOLLOW) != 0) {
    return errno == ENOENT ? SQLITE_OK : SQLITE_IOERR_ACCESS;
  }
  *result = !S_ISREG(status.st_mode) || status.st_size > 0;
  return SQLITE_OK;
}

// SQLite's own would look up what the directory's descriptor names.
int fullPath(sqlite3_vfs*, const char* path, int capacity, char* full) {
  const std::size_t length = std::strlen(path) + 1;
  if (length > static_cast<std::size_t>(capacity)) return SQLITE_CANTOPEN;
  std::memcpy(full, path, length);
  return SQLITE_OK;
}

const char* registerFileSystem() {
  sqlite3_vfs* const system = ::sqlite3_vfs_find("unix");
  if (system == nullptr || base() == nullptr || system->iVersion < 3) return nullptr;
  sqliteFstat = reinterpret_cast<FstatCall>(system->xGetSystemCall(system, "fstat"));
  const bool replaced = sqliteFstat != nullptr &&
                        replaceCall(*system, "open", formerOpen, OpenCall(openFile)) &&
                        replaceCall(*system, "stat", formerStat, StatCall(statFile)) &&
                        replaceCall(*system, "unlink", formerUnlink, UnlinkCall(unlinkFile));
  if (!replaced) return nullptr;
  static sqlite3_vfs ours = *base();
  ours.zName = "tally-store";
  ours.pNext = nullptr;
  ours.xOpen = open;
  ours.xDelete = remove;
  ours.xAccess = access;
  ours.xFullPathname = fullPath;
  return ::sqlite3_vfs_register(&ours, 0) == SQLITE_OK ? ours.zName : nullptr;
}

}  // namespace

const char* storeFileSystem() {
  static const char* const name = registerFileSystem();
  return name;
}

std::string storeFileName(const Directory& directory, std::string_view name) {
  return std::string(kDescriptors) + std::to_string(stores().add(directory, name)) + "/" +
         std::string(name);
}

std::string takeStoreFileRefusal() { return std::exchange(refusal, {}); }

}  // namespace tally
