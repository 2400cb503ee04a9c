#include "base/process.h"

#include <unistd.h>

#include <cerrno>

namespace tally {

std::string programName() { return ::program_invocation_short_name; }

int processID() { return ::getpid(); }

std::ptrdiff_t writeOnce(int descriptor, std::string_view bytes) {
  return ::write(descriptor, bytes.data(), bytes.size());
}

}  // namespace tally
