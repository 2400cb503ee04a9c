#include "base/child_process.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <ctime>
#include <vector>

#include "base/files/file.h"
#include "base/process.h"

namespace tally {
namespace {

constexpr int kCannotExecute = 126;
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

std::vector<char*> pointersTo(std::span<const std::string> words) {
  std::vector<char*> pointers;
  for (const std::string& word : words) pointers.push_back(const_cast<char*>(word.c_str()));
  pointers.push_back(nullptr);
  return pointers;
}

// With the signals whose handling it begins with as by default. Null: in the background, where no
// signal is blocked and nobody reads what it prints.
Result<pid_t> start(const std::string& program, std::span<const std::string> words,
                    const sigset_t* defaults) {
  const auto arguments = pointersTo(words);
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

// The child, up to the program's start.
[[noreturn]] void execute(int program, char* const* words, char* const* environment) {
  constexpr int kProgram = 3;
  ::setpgid(0, 0);
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  ::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0);
  for (int number = 1; number < NSIG; ++number) ::signal(number, SIG_DFL);
  sigset_t none;
  ::sigemptyset(&none);
  ::sigprocmask(SIG_SETMASK, &none, nullptr);
  const int nothing = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
  // A script's interpreter opens the descriptor again, so it stays open.
  if (nothing >= 0 && ::dup2(nothing, STDIN_FILENO) == STDIN_FILENO &&
      (program == kProgram ? ::fcntl(program, F_SETFD, 0) : ::dup2(program, kProgram)) >= 0 &&
      ::close_range(kProgram + 1, ~0u, 0) == 0) {
    ::fexecve(kProgram, words, environment);
  }
  ::_exit(kCannotExecute);
}

// Whether the child has ended by then. It can still be waited for: until then nobody else has its
// number.
bool endsWithin(pid_t child, std::chrono::milliseconds limit) {
  using std::chrono::steady_clock;
  const auto end = steady_clock::now() + limit;
  sigset_t childEnds;
  ::sigemptyset(&childEnds);
  ::sigaddset(&childEnds, SIGCHLD);
  for (;;) {
    siginfo_t ended{};
    const auto number = static_cast<id_t>(child);
    if (::waitid(P_PID, number, &ended, WEXITED | WNOHANG | WNOWAIT) != 0 || ended.si_pid != 0) {
      return true;
    }
    const auto left =
        std::chrono::duration_cast<std::chrono::nanoseconds>(end - steady_clock::now()).count();
    if (left <= 0) return false;
    constexpr std::int64_t kSecond = 1'000'000'000;
    const timespec patience{left / kSecond, static_cast<long>(left % kSecond)};
    ::sigtimedwait(&childEnds, nullptr, &patience);
  }
}

}  // namespace

Result<int> runWithLimit(int program, std::span<const std::string> words,
                         std::span<const std::string> environment,
                         std::chrono::milliseconds limit) {
  const auto arguments = pointersTo(words), variables = pointersTo(environment);
  sigset_t childEnds, before;
  ::sigemptyset(&childEnds);
  ::sigaddset(&childEnds, SIGCHLD);
  ::sigprocmask(SIG_BLOCK, &childEnds, &before);
  const pid_t child = ::fork();
  if (child == 0) execute(program, arguments.data(), variables.data());
  const Error fault = systemError("cannot run", words.front());
  int status = 0;
  bool ended = false;
  if (child > 0) {
    ::setpgid(child, child);  // whichever of the two comes first
    ended = endsWithin(child, limit);
    ::kill(-child, SIGKILL);
    retried([&] { return ::waitpid(child, &status, 0); });
  }
  ::sigprocmask(SIG_SETMASK, &before, nullptr);
  if (child < 0) return fault;
  if (!ended) {
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(limit).count();
    return Error{"killed, since it did not end within " + std::to_string(seconds) + " s"};
  }
  return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

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
  auto path = programFile();
  if (!path) return path.error();
  path->resize(path->rfind('/') + 1);
  ::signal(SIGCHLD, SIG_IGN);  // the kernel forgets the child at its end
  const auto child = start(*path + words.front(), words, nullptr);
  return child ? Status(Done{}) : child.error();
}

}  // namespace tally
