// Calls on files. The linker leads each one of the program to __wrap_NAME, and __real_NAME to the
// system's (CMakeLists.txt lists them); SQLite is given some of the same functions. Its syncs
// cannot be replaced, but call what the program defines under these names.
#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cmath>
#include <cstdarg>
#include <set>
#include <utility>

#include "faults/disk.h"
#include "faults/fault.h"

extern "C" long __real_syscall(long, ...);

namespace tally::faults {
namespace {

// The paths of open files, by descriptor, for calls without a path.
struct OpenFile {
  std::string path;
  bool written = false;
};
std::array<OpenFile, 1024> openFiles;
double clockSeconds = 0;
std::set<std::string> entered;

OpenFile& openFile(int descriptor) {
  static OpenFile none;
  return descriptor >= 0 && descriptor < std::ssize(openFiles)
             ? openFiles[static_cast<std::size_t>(descriptor)]
             : none;
}

std::string pathAt(int directory, std::string_view name) {
  if (directory == AT_FDCWD || name.starts_with('/')) return std::string(name);
  const std::string& path = openFile(directory).path;
  if (name == ".") return path;
  return (path == "/" ? "" : path) + "/" + std::string(name);
}

// True when the call is to fail, with errno set.
bool fails(const char* call, std::string_view path, unsigned possible) {
  if (judge(call, path, possible) != Verdict::Fail) return false;
  errno = faultCode();
  return true;
}

template <class Write>
ssize_t writeJudged(const char* call, int file, size_t count, const Write& write) {
  contentsChange(openFile(file).path);
  switch (judge(call, openFile(file).path,
                kNoSpace | kInputOutput | kInterrupted | kLastCall |
                    (count > 1 ? kHalfWrite | kShortWrite : 0))) {
    case Verdict::Fail:
      errno = faultCode();
      return -1;
    case Verdict::WriteHalf:
      return write(count / 2);
    case Verdict::KillHalfWay:
      write(count / 2);
      die();
    case Verdict::Go:
      break;
  }
  return write(count);
}

// A directory's contents are its names.
int syncJudged(const char* call, int file, unsigned possible) {
  const std::string& path = openFile(file).path;
  if (fails(call, path, kNoSpace | kInputOutput | kLastCall | possible)) return -1;
  const auto result = static_cast<int>(__real_syscall(SYS_fsync, file));
  if (result == 0) {
    contentsSynced(path);
    namesSynced(path);
  }
  return result;
}

}  // namespace

const std::string& pathOf(int descriptor) { return openFile(descriptor).path; }

void forgetDirectories() { entered.clear(); }

void setClock(double secondsSince1970) { clockSeconds = secondsSince1970; }

}  // namespace tally::faults

using namespace tally::faults;

extern "C" {

int __real_openat(int, const char*, int, ...);
int __real_close(int);
ssize_t __real_read(int, void*, size_t);
ssize_t __real_pread(int, void*, size_t, off_t);
ssize_t __real_write(int, const void*, size_t);
ssize_t __real_pwrite(int, const void*, size_t, off_t);
int __real_ftruncate(int, off_t);
int __real_flock(int, int);
int __real_fstat(int, struct stat*);
int __real_fstatat(int, const char*, struct stat*, int);
int __real_renameat2(int, const char*, int, const char*, unsigned);
int __real_unlinkat(int, const char*, int);
int __real_mkdirat(int, const char*, mode_t);
DIR* __real_fdopendir(int);
void* __real_mmap(void*, size_t, int, int, int, off_t);
int __real_clock_gettime(clockid_t, timespec*);

int __wrap_openat(int directory, const char* name, int flags, ...) {
  va_list arguments;
  va_start(arguments, flags);
  const mode_t mode = (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
  va_end(arguments);
  const bool creates = (flags & O_CREAT) != 0;
  const std::string path = pathAt(directory, name);
  // The way down to each file is half a dozen directories, each of which need not fail more than
  // once, and in one way.
  const unsigned possible = (flags & O_DIRECTORY) != 0 ? (entered.insert(path).second ? kDenied : 0)
                                                       : kInputOutput | kDenied | kInterrupted |
                                                             (creates ? kNoSpace | kLastCall : 0);
  if (fails(creates ? "create" : "open", path, possible)) return -1;
  const NameChange change(NameChange::Kind::Create, creates ? path : "");
  const int file = change.done(__real_openat(directory, name, flags, mode));
  if (file >= 0) openFile(file) = {path, (flags & O_ACCMODE) != O_RDONLY};
  return file;
}

// The hardened headers call this where nothing is created.
int __wrap___openat_2(int directory, const char* name, int flags) {
  return __wrap_openat(directory, name, flags);
}

// The one call that the system library has no name for.
long __wrap_syscall(long number, int directory, const char* name, const void* how, size_t size) {
  const std::string path = pathAt(directory, name);
  if (fails("open", path, entered.insert(path).second ? kDenied : 0)) return -1;
  const long file = __real_syscall(number, directory, name, how, size);
  if (file >= 0) openFile(static_cast<int>(file)) = {path, false};
  return file;
}

// The file is closed whatever the result.
int __wrap_close(int file) {
  const OpenFile closed = std::exchange(openFile(file), {});
  const int result = __real_close(file);
  return closed.written && fails("close", closed.path, kNoSpace | kInputOutput) ? -1 : result;
}

ssize_t __wrap_read(int file, void* bytes, size_t count) {
  if (fails("read", openFile(file).path, kInputOutput | kInterrupted)) return -1;
  return __real_read(file, bytes, count);
}

ssize_t __wrap_pread(int file, void* bytes, size_t count, off_t offset) {
  if (fails("pread", openFile(file).path, kInputOutput | kInterrupted)) return -1;
  return __real_pread(file, bytes, count, offset);
}

ssize_t __wrap_write(int file, const void* bytes, size_t count) {
  return writeJudged("write", file, count,
                     [=](size_t part) { return __real_write(file, bytes, part); });
}

ssize_t __wrap_pwrite(int file, const void* bytes, size_t count, off_t offset) {
  return writeJudged("pwrite", file, count,
                     [=](size_t part) { return __real_pwrite(file, bytes, part, offset); });
}

int __wrap_fsync(int file) { return syncJudged("fsync", file, kInterrupted); }
int __wrap_fdatasync(int file) { return syncJudged("fdatasync", file, kInterrupted); }

// SQLite's, which does not try an interrupted one again.
__attribute__((visibility("default"))) int fsync(int file) {
  return syncJudged("store: fsync", file, 0);
}
__attribute__((visibility("default"))) int fdatasync(int file) {
  return syncJudged("store: fdatasync", file, 0);
}

int __wrap_ftruncate(int file, off_t size) {
  if (fails("ftruncate", openFile(file).path, kInputOutput | kInterrupted | kLastCall)) return -1;
  contentsChange(openFile(file).path);
  return __real_ftruncate(file, size);
}

int __wrap_flock(int file, int operation) {
  if (fails("flock", openFile(file).path, kInputOutput | kInterrupted)) return -1;
  return __real_flock(file, operation);
}

int __wrap_fstat(int file, struct stat* status) {
  if (fails("fstat", openFile(file).path, kInputOutput)) return -1;
  return __real_fstat(file, status);
}

int __wrap_fstatat(int directory, const char* name, struct stat* status, int flags) {
  if (fails("fstatat", pathAt(directory, name), kInputOutput | kDenied)) return -1;
  return __real_fstatat(directory, name, status, flags);
}

int __wrap_renameat2(int from, const char* name, int to, const char* newName, unsigned flags) {
  const std::string path = pathAt(to, newName);
  if (fails("rename to", path, kNoSpace | kInputOutput | kDenied | kLastCall)) return -1;
  const NameChange change(NameChange::Kind::Rename, pathAt(from, name), path);
  return change.done(__real_renameat2(from, name, to, newName, flags));
}

int __wrap_renameat(int from, const char* name, int to, const char* newName) {
  return __wrap_renameat2(from, name, to, newName, 0);
}

int __wrap_unlinkat(int directory, const char* name, int flags) {
  const std::string path = pathAt(directory, name);
  if (fails("unlink", path, kInputOutput | kDenied | kLastCall)) return -1;
  const NameChange change(NameChange::Kind::Remove, path);
  return change.done(__real_unlinkat(directory, name, flags));
}

int __wrap_mkdirat(int directory, const char* name, mode_t mode) {
  const std::string path = pathAt(directory, name);
  if (fails("mkdir", path, kNoSpace | kInputOutput | kDenied | kLastCall)) return -1;
  const NameChange change(NameChange::Kind::Create, path);
  return change.done(__real_mkdirat(directory, name, mode));
}

DIR* __wrap_fdopendir(int directory) {
  if (fails("list", openFile(directory).path, kInputOutput | kDenied)) return nullptr;
  return __real_fdopendir(directory);
}

void* __wrap_mmap(void* place, size_t size, int access, int flags, int file, off_t offset) {
  if (!memoryRunsOut("mmap")) return __real_mmap(place, size, access, flags, file, offset);
  errno = ENOMEM;
  return MAP_FAILED;
}

int __wrap_clock_gettime(clockid_t clock, timespec* now) {
  if (clock != CLOCK_REALTIME) return __real_clock_gettime(clock, now);
  *now = {static_cast<time_t>(std::floor(clockSeconds)), 0};
  return 0;
}
}
