#include "host/bus/bus_root.h"

#include <fmt/core.h>
#include <sys/stat.h>
#include <systemd/sd-bus.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <memory>
#include <optional>

#include "base/files/file.h"

namespace tally {
namespace {

struct CredentialsDeleter {
  void operator()(sd_bus_creds* credentials) const { ::sd_bus_creds_unref(credentials); }
};

// The device root of a process, as a path that leads there from here; empty when its environment
// cannot be read.
std::optional<std::string> rootOfProcess(int process) {
  constexpr std::size_t kLargestEnvironment = 4u << 20;
  constexpr std::string_view kVariable = "TALLYRUN_ROOT=";
  const std::string folder = fmt::format("/proc/{}", process);
  const auto environment = readFile(folder + "/environ", kLargestEnvironment);
  if (!environment) return std::nullopt;
  for (std::size_t begin = 0; begin < environment->size();) {
    const std::size_t end = std::min(environment->find('\0', begin), environment->size());
    const std::string_view variable = std::string_view(*environment).substr(begin, end - begin);
    if (variable.starts_with(kVariable) && variable.size() > kVariable.size()) {
      const std::string root(variable.substr(kVariable.size()));
      return root.starts_with('/') ? root : folder + "/cwd/" + root;
    }
    begin = end + 1;
  }
  return "/";
}

bool isSameFolder(const std::string& a, const std::string& b) {
  struct stat first {
  }, second{};
  return ::stat(a.c_str(), &first) == 0 && ::stat(b.c_str(), &second) == 0 &&
         first.st_dev == second.st_dev && first.st_ino == second.st_ino;
}

}  // namespace

Result<std::string> findEndpoint(sd_bus* bus, std::string_view name, const std::string& root) {
  const std::string wanted(name);
  sd_bus_error error{};
  // Also the answer when it runs already.
  const int result = ::sd_bus_call_method(bus, "org.freedesktop.DBus", "/org/freedesktop/DBus",
                                          "org.freedesktop.DBus", "StartServiceByName", &error,
                                          nullptr, "su", wanted.c_str(), 0u);
  const bool started = result >= 0;
  ::sd_bus_error_free(&error);
  sd_bus_creds* made = nullptr;
  const int found = ::sd_bus_get_name_creds(bus, wanted.c_str(),
                                            SD_BUS_CREDS_PID | SD_BUS_CREDS_UNIQUE_NAME, &made);
  const std::unique_ptr<sd_bus_creds, CredentialsDeleter> credentials(made);
  pid_t process = 0;
  const char* connection = nullptr;
  if (found < 0 || ::sd_bus_creds_get_unique_name(credentials.get(), &connection) < 0 ||
      ::sd_bus_creds_get_pid(credentials.get(), &process) < 0) {
    return Error{started ? fmt::format("{} is already gone", wanted)
                         : fmt::format("{} does not run, and the bus cannot start it: {}", wanted,
                                       std::strerror(-result)),
                 ESRCH};
  }
  const auto served = rootOfProcess(process);
  if (!served) {
    return Error{fmt::format("the device root of the process {}, which has the name {}, cannot be "
                             "read",
                             process, wanted),
                 EACCES};
  }
  const std::string wantedRoot = root.empty() ? "/" : root;
  if (isSameFolder(*served, wantedRoot)) return std::string(connection);
  return Error{
      fmt::format("the program that the bus reaches serves the device root {}, not {}; start "
                  "one with TALLYRUN_ROOT={} tallyrun",
                  *served, wantedRoot, wantedRoot),
      EXDEV};
}

}  // namespace tally
