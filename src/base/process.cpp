#include "base/process.h"

#include <sys/auxv.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <csignal>

#include "base/files/file.h"

namespace tally {

std::string programName() { return ::program_invocation_short_name; }

Result<std::string> programFile() {
  char path[PATH_MAX];
  const ssize_t length = ::readlink("/proc/self/exe", path, sizeof path);
  if (length <= 0) {
    // Without /proc, the path that the kernel was given; a caller with fewer rights may not choose.
    const auto* const given = reinterpret_cast<const char*>(::getauxval(AT_EXECFN));
    if (given != nullptr && given[0] == '/' && ::getauxval(AT_SECURE) == 0)
      return std::string(given);
    return systemError("cannot read", "/proc/self/exe");
  }
  std::string_view found(path, static_cast<std::size_t>(length));
  // An upgrade that replaced the file meanwhile has put another in its place.
  constexpr std::string_view kReplaced = " (deleted)";
  if (found.ends_with(kReplaced)) found.remove_suffix(kReplaced.size());
  return std::string(found);
}

bool isRoot() { return ::geteuid() == 0; }

int processID() { return ::getpid(); }

void surviveFailedWrites() {
  std::signal(SIGPIPE, SIG_IGN);
  std::signal(SIGXFSZ, SIG_IGN);
}

std::ptrdiff_t writeOnce(int descriptor, std::string_view bytes) {
  return ::write(descriptor, bytes.data(), bytes.size());
}

std::ptrdiff_t readOnce(int descriptor, std::span<char> bytes) {
  return retried([&] { return ::read(descriptor, bytes.data(), bytes.size()); });
}

}  // namespace tally
