#include "host/spool/waiting_logs.h"

#include <cerrno>
#include <optional>

#include "base/files/file_lock.h"
#include "base/files/temporary_file.h"
#include "host/spool/sequence_folder.h"
#include "host/spool/submission_identity.h"

namespace tally {
namespace {

bool isWaiting(std::string_view name) { return sequenceOf(name) || isTemporaryName(name); }

std::optional<Status> handle(const Directory& directory, const std::string& name,
                             WaitingAction action) {
  const bool held = name.ends_with(kHeldSuffix);
  switch (action) {
    case WaitingAction::Erase:
      return directory.remove(name);
    case WaitingAction::Hold:
      if (held || isTemporaryName(name)) return std::nullopt;
      return directory.rename(name, name + std::string(kHeldSuffix));
    case WaitingAction::Release:
      if (!held) return std::nullopt;
      return directory.rename(name, name.substr(0, name.size() - kHeldSuffix.size()));
  }
  return std::nullopt;
}

Status handleFolder(const Directory& directory, std::string_view lockName, WaitingAction action,
                    std::uint64_t& count) {
  const auto names = directory.list();
  if (!names) return names.error();
  std::optional<Result<FileLock>> lock;
  Status status = Done{};
  for (const std::string& name : *names) {
    if (!isWaiting(name) || (action == WaitingAction::Release && !name.ends_with(kHeldSuffix))) {
      continue;
    }
    if (!lock) lock = FileLock::acquire(directory, lockName);
    if (!*lock) return lock->error();
    const auto handled = handle(directory, name, action);
    if (!handled) continue;
    if (*handled) {
      ++count;
    } else {
      status = *handled;
    }
  }
  if (lock && status) status = directory.sync();
  return status;
}

// Every run comes here, also one that submits nothing, so what a failing one left is removed here.
Status tidyIdentity(const DeviceRoot& root, WaitingAction action) {
  const IdentityFile file(root);
  bool erases = false;
  if (action == WaitingAction::Erase) {
    const auto identity = file.read();
    erases = identity || identity.error().systemError != ENOENT;
  }
  if (!erases && !file.hasLeftOvers()) return Done{};
  // A log that is being submitted writes its number first.
  const auto spool = kSubmittedLogs.on(root).open();
  if (!spool && spool.error().systemError != ENOENT) return spool.error();
  std::optional<Result<FileLock>> lock;
  if (spool) lock = FileLock::acquire(*spool, kSubmittedLogs.lock);
  if (lock && !*lock) return lock->error();
  file.sweep();
  return erases ? file.erase() : Done{};
}

}  // namespace

WaitingFiles countWaiting(const DeviceRoot& root) {
  WaitingFiles waiting;
  for (const LogFolder& folder : kLogFolders) {
    const auto directory = folder.on(root).open();
    const auto names = directory ? directory->list() : Result<std::vector<std::string>>(Error{});
    if (!names) continue;
    for (const std::string& name : *names) {
      const auto identity = isWaiting(name) ? directory->identity(name) : std::nullopt;
      if (!identity) continue;
      ++waiting.files;
      waiting.bytes += identity->size;
    }
  }
  return waiting;
}

Result<std::uint64_t> handleWaiting(const DeviceRoot& root, WaitingAction action) {
  std::uint64_t count = 0;
  Status status = Done{};
  for (const LogFolder& folder : kLogFolders) {
    const auto directory = folder.on(root).open();
    if (!directory && directory.error().systemError == ENOENT) continue;
    const Status handled = directory ? handleFolder(*directory, folder.lock, action, count)
                                     : Status(directory.error());
    if (!handled) status = handled;
  }
  if (const Status tidied = tidyIdentity(root, action); !tidied) status = tidied;
  if (!status) return status.error();
  return count;
}

}  // namespace tally
