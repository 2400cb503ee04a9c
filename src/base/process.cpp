#include "base/process.h"

#include <unistd.h>

#include <cerrno>
#include <csignal>

#include "base/files/file.h"

namespace tally {

std::string programName() { return ::program_invocation_short_name; }

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
