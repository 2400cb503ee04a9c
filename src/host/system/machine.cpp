#include "host/system/machine.h"

#include <pwd.h>
#include <signal.h>
#include <spawn.h>
#include <sys/timex.h>
#include <unistd.h>

#include <cstring>

#include "base/files/device_root.h"

namespace tally {
namespace {

constexpr std::size_t kLongestId = 64;

}  // namespace

std::string bootId() {
  auto text = DeviceRoot("").readFile("/proc/sys/kernel/random/boot_id", kLongestId);
  if (!text) return "";
  text->resize(text->find_last_not_of('\n') + 1);
  return *text;
}

bool clockIsSynchronised() {
  timex state{};
  const int status = ::adjtimex(&state);
  return status >= 0 && status != TIME_ERROR && (state.status & STA_UNSYNC) == 0;
}

std::optional<std::int64_t> userNumber(std::string_view name) {
  const passwd* const user = ::getpwnam(std::string(name).c_str());
  if (user == nullptr) return std::nullopt;
  return static_cast<std::int64_t>(user->pw_uid);
}

std::string userName(std::int64_t user) {
  const passwd* const entry = user >= 0 ? ::getpwuid(static_cast<uid_t>(user)) : nullptr;
  return entry != nullptr ? entry->pw_name : std::to_string(user);
}

Status startNeighbour(std::string_view program, const std::vector<std::string>& arguments) {
  char self[4096];
  const ssize_t length = ::readlink("/proc/self/exe", self, sizeof self);
  if (length <= 0) return Error{"/proc/self/exe: " + std::string(std::strerror(errno)), errno};
  std::string path(self, static_cast<std::size_t>(length));
  path.resize(path.rfind('/') + 1);
  path += program;
  std::vector<std::string> texts{path};
  texts.insert(texts.end(), arguments.begin(), arguments.end());
  std::vector<char*> pointers;
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  sigset_t none;
  ::sigemptyset(&none);
  ::posix_spawnattr_setsigmask(&attributes, &none);
  ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  ::signal(SIGCHLD, SIG_IGN);  // nobody waits for it
  pid_t child = 0;
  const int error =
      ::posix_spawn(&child, path.c_str(), nullptr, &attributes, pointers.data(), ::environ);
  ::posix_spawnattr_destroy(&attributes);
  return error == 0 ? Status(Done{}) : Error{path + ": " + std::strerror(error), error};
}

}  // namespace tally
