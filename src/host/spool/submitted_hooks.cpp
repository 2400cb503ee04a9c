#include "host/spool/submitted_hooks.h"

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <algorithm>
#include <array>
#include <cerrno>

#include "base/child_process.h"
#include "host/spool/waiting_logs.h"

namespace tally {
namespace {

constexpr mode_t kWritableByOthers = S_IWGRP | S_IWOTH;

// Who could change it could run programs as the hooks' user.
Status checkOwner(const struct stat& status, const std::string& path) {
  if (status.st_uid != 0) {
    return Error{
        fmt::format("{} belongs to user {} instead of root; no hook is run", path, status.st_uid)};
  }
  if ((status.st_mode & kWritableByOthers) != 0) {
    return Error{fmt::format("{} can be written by others than root; no hook is run", path)};
  }
  return Done{};
}

Status checkDirectory(const Directory& directory) {
  struct stat status {};
  if (::fstat(directory.descriptor(), &status) != 0) {
    return systemError("cannot examine", directory.path());
  }
  return checkOwner(status, directory.path());
}

bool isHookName(std::string_view name) {
  return std::ranges::all_of(name, [](char letter) {
    return (letter >= '0' && letter <= '9') || (letter >= 'a' && letter <= 'z') ||
           (letter >= 'A' && letter <= 'Z') || letter == '-' || letter == '_';
  });
}

// Without a descriptor: not executable.
Result<Descriptor> openHook(const Directory& directory, const std::string& name) {
  Descriptor file(retried([&] {
    return ::openat(directory.descriptor(), name.c_str(),
                    O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC);
  }));
  if (!file) return systemError("cannot open", directory.pathOf(name));
  struct stat status {};
  if (::fstat(file.get(), &status) != 0) return systemError("cannot examine", name);
  if (!S_ISREG(status.st_mode) || (status.st_mode & (S_IXUSR | S_IXGRP | S_IXOTH)) == 0) {
    return Descriptor();
  }
  if (auto checked = checkOwner(status, directory.pathOf(name)); !checked) return checked.error();
  return file;
}

// Whether reading was refused since the name is not that of a file of the directory's user.
bool isRefused(const Error& error) {
  const int codes[] = {ELOOP, EPERM, EMLINK, EISDIR, ENXIO};
  return std::ranges::find(codes, error.systemError) != std::end(codes);
}

// What a hook is told of the log; what its information does not say is not set.
std::vector<std::string> environmentOf(const Directory& folder, const SpooledLog& log,
                                       const std::string& information) {
  std::vector<std::string> variables = {"PATH=/usr/local/bin:/usr/bin:/bin", "LC_ALL=C.UTF-8",
                                        "TALLYRUN_LOG=" + folder.pathOf(log.fileName),
                                        "TALLYRUN_INFORMATION=" + folder.pathOf(information)};
  if (!log.name.empty()) variables.push_back("TALLYRUN_NAME=" + log.name);
  if (!log.typeCode.empty()) variables.push_back("TALLYRUN_TYPE=" + log.typeCode);
  if (isDevicePseudonym(log.device)) variables.push_back("TALLYRUN_DEVICE=" + log.device);
  if (log.deviceSequence) {
    variables.push_back(fmt::format("TALLYRUN_SEQUENCE={}", *log.deviceSequence));
  }
  return variables;
}

Status runAll(const Directory& folder, const std::vector<Hook>& hooks, const SpooledLog& log,
              std::chrono::seconds limit, const std::function<bool()>& consent) {
  const auto stem = log.fileName.substr(0, log.fileName.size() - kBodySuffix.size());
  const std::string information = stem + std::string(kInformationSuffix);
  const std::array names{log.fileName, information};
  const std::array shown{folder.identity(names[0]), folder.identity(names[1])};
  // Whoever may write here could show a hook another file of the system under this name.
  for (std::size_t i = 0; i < names.size(); ++i) {
    if (shown[i] && !shown[i]->regular) return Error{folder.pathOf(names[i]) + " is not a file"};
    if (auto sound = folder.readFile(names[i], 0); !sound && isRefused(sound.error())) {
      return sound.error();
    }
  }
  for (const Hook& hook : hooks) {
    if (!consent()) return Error{"submission is not allowed on this device"};
    const std::string words[] = {hook.name, folder.pathOf(log.fileName),
                                 folder.pathOf(information)};
    const auto ended =
        runWithLimit(hook.program.get(), words, environmentOf(folder, log, information), limit);
    const std::string fault = !ended        ? ended.error().message
                              : *ended != 0 ? fmt::format("ended with status {}", *ended)
                                            : "";
    if (!fault.empty()) {
      return Error{fmt::format("{}: hook {}: {}; the log stays", log.fileName, hook.name, fault)};
    }
  }
  // One that has been held back meanwhile has left all the same. The body goes first: information
  // alone is not a log.
  for (std::size_t i = 0; i < names.size(); ++i) {
    for (const std::string_view suffix : {std::string_view(), kHeldSuffix}) {
      const std::string name = names[i] + std::string(suffix);
      // A hook may have removed it, and a later log have got its name.
      const auto present = folder.identity(name);
      if (present && present != shown[i]) {
        return Error{folder.pathOf(name) + " is another file than the hooks were shown; it stays"};
      }
      if (!present) continue;
      if (auto removed = folder.remove(name); !removed) return removed;
    }
  }
  return folder.sync();
}

}  // namespace

Result<std::vector<Hook>> openHooks(const DeviceRoot& root) {
  std::vector<Hook> hooks;
  auto directory = root.open("/");
  if (!directory) return directory.error();
  for (std::string_view left = kHooksFolder.substr(1); !left.empty();) {
    if (auto checked = checkDirectory(*directory); !checked) return checked.error();
    const std::size_t end = std::min(left.find('/'), left.size());
    directory = directory->openDirectory(left.substr(0, end));
    left.remove_prefix(std::min(end + 1, left.size()));
    if (!directory && directory.error().systemError == ENOENT) return hooks;
    if (!directory) return directory.error();
  }
  if (auto checked = checkDirectory(*directory); !checked) return checked.error();
  const auto names = directory->list();
  if (!names) return names.error();
  for (const std::string& name : *names) {
    if (!isHookName(name)) continue;
    auto program = openHook(*directory, name);
    if (!program) return program.error();
    if (*program) hooks.push_back({name, *std::move(program)});
  }
  return hooks;
}

Result<HookRun> runHooks(const DeviceRoot& root, const std::vector<Hook>& hooks,
                         std::chrono::seconds limit, const std::function<bool()>& consent) {
  HookRun run;
  const auto folder = kOutgoingLogs.on(root).open();
  if (!folder && folder.error().systemError == ENOENT) return run;
  if (!folder) return folder.error();
  // Of the directory itself: a lock file of one user is not another's to open.
  if (retried([&] { return ::flock(folder->descriptor(), LOCK_EX | LOCK_NB); }) != 0) {
    return errno == EWOULDBLOCK ? Error{"another run of the hooks is at work"}
                                : systemError("cannot lock", folder->path());
  }
  const auto logs = listSpooled(*folder);
  if (!logs) return logs.error();
  for (const SpooledLog& log : *logs) {
    const Status taken =
        hooks.empty() ? Status(Error{}) : runAll(*folder, hooks, log, limit, consent);
    if (taken) {
      ++run.done;
      continue;
    }
    ++run.waiting;
    if (!hooks.empty()) run.faults.push_back(taken.error().message);
  }
  return run;
}

}  // namespace tally
