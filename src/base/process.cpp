#include "base/process.h"

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
  if (length <= 0) return systemError("cannot read", "/proc/self/exe");
  return std::string(path, static_cast<std::size_t>(length));
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
