#include "base/child_process.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <climits>
#include <vector>

#include "base/files/file.h"

namespace tally {
namespace {

constexpr std::array kTerminalSignals = {SIGINT, SIGQUIT};

// Ignores the terminal's signals while it lives.
class TerminalSignals {
 public:
  TerminalSignals() {
    struct sigaction ignore {};
    ignore.sa_handler = SIG_IGN;
    for (std::size_t i = 0; i < kTerminalSignals.size(); ++i) {
      ::sigaction(kTerminalSignals[i], &ignore, &before_[i]);
    }
  }
  ~TerminalSignals() {
    for (std::size_t i = 0; i < kTerminalSignals.size(); ++i) {
      ::sigaction(kTerminalSignals[i], &before_[i], nullptr);
    }
  }
  TerminalSignals(const TerminalSignals&) = delete;
  TerminalSignals& operator=(const TerminalSignals&) = delete;

  // What the program is to handle as it would without us: these, unless they were ignored before,
  // and those that surviveFailedWrites() ignores.
  sigset_t childDefaults() const {
    sigset_t set;
    ::sigemptyset(&set);
    ::sigaddset(&set, SIGPIPE);
    ::sigaddset(&set, SIGXFSZ);
    for (std::size_t i = 0; i < kTerminalSignals.size(); ++i) {
      if (before_[i].sa_handler != SIG_IGN) ::sigaddset(&set, kTerminalSignals[i]);
    }
    return set;
  }

 private:
  struct sigaction before_[kTerminalSignals.size()];
};

// With the signals whose handling it begins with as by default. Null: in the background, where no
// signal is blocked and nobody reads what it prints.
Result<pid_t> start(const std::string& program, std::span<const std::string> words,
                    const sigset_t* defaults) {
  std::vector<char*> arguments;
  for (const std::string& word : words) arguments.push_back(const_cast<char*>(word.c_str()));
  arguments.push_back(nullptr);
  posix_spawnattr_t attributes;
  ::posix_spawnattr_init(&attributes);
  posix_spawn_file_actions_t files;
  ::posix_spawn_file_actions_init(&files);
  sigset_t none;
  ::sigemptyset(&none);
  if (defaults != nullptr) {
    ::posix_spawnattr_setsigdefault(&attributes, defaults);
    ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF);
  } else {
    ::posix_spawn_file_actions_addopen(&files, STDOUT_FILENO, "/dev/null", O_WRONLY, 0);
    ::posix_spawnattr_setsigmask(&attributes, &none);
    ::posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  }
  pid_t child = -1;
  const int fault =
      ::posix_spawnp(&child, program.c_str(), &files, &attributes, arguments.data(), environ);
  ::posix_spawn_file_actions_destroy(&files);
  ::posix_spawnattr_destroy(&attributes);
  if (fault != 0) return systemError("cannot run", words.front(), fault);
  return child;
}

}  // namespace

Result<int> runInForeground(std::span<const std::string> words) {
  const TerminalSignals signals;
  const sigset_t defaults = signals.childDefaults();
  const auto child = start(words.front(), words, &defaults);
  if (!child) return child.error();
  int status = 0;
  if (retried([&] { return ::waitpid(*child, &status, 0); }) < 0) {
    return systemError("cannot wait for", words.front());
  }
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

Status startInBackground(std::span<const std::string> words) {
  char self[PATH_MAX];
  const ssize_t length = ::readlink("/proc/self/exe", self, sizeof self);
  if (length <= 0) return systemError("cannot read", "/proc/self/exe");
  std::string path(self, static_cast<std::size_t>(length));
  path.resize(path.rfind('/') + 1);
  ::signal(SIGCHLD, SIG_IGN);  // the kernel forgets the child at its end
  const auto child = start(path + words.front(), words, nullptr);
  return child ? Status(Done{}) : child.error();
}

}  // namespace tally
