#include "host/ingress/socket_directory.h"

#include <fcntl.h>
#include <fmt/core.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

namespace tally {
namespace {

// sticky: others may write it if they cannot replace what is not theirs.
Status checkDirectory(const Directory& directory, const std::vector<uid_t>& owners, bool sticky) {
  struct stat status {};
  if (::fstat(directory.descriptor(), &status) != 0) {
    return systemError("cannot examine", directory.path());
  }
  if (std::find(owners.begin(), owners.end(), status.st_uid) == owners.end()) {
    return Error{fmt::format("{} belongs to user {}, so its sockets are not trusted",
                             directory.path(), status.st_uid),
                 EPERM};
  }
  const bool othersWrite = (status.st_mode & (S_IWGRP | S_IWOTH)) != 0;
  if (othersWrite && !(sticky && (status.st_mode & S_ISVTX) != 0)) {
    return Error{fmt::format("{} can be written by other users, so its sockets are not trusted",
                             directory.path()),
                 EPERM};
  }
  return Done{};
}

}  // namespace

Result<Directory> openSocketDirectory(const DeviceRoot& root, const std::vector<uid_t>& owners) {
  const auto parent = root.open(kRecorderParent);
  if (!parent) return parent.error();
  auto directory = parent->openDirectory(kRecorderDirectory);
  if (!directory) return directory.error();
  if (auto checked = checkDirectory(*parent, owners, /*sticky=*/true); !checked) {
    return checked.error();
  }
  if (auto checked = checkDirectory(*directory, owners, /*sticky=*/false); !checked) {
    return checked.error();
  }
  return directory;
}

Result<Directory> makeSocketDirectory(const DeviceRoot& root, const std::vector<uid_t>& owners) {
  constexpr mode_t kMode = 0755;
  auto present = openSocketDirectory(root, owners);
  if (present || present.error().systemError != ENOENT) return present;
  const auto parent = root.make(kRecorderParent);
  if (!parent) return parent.error();
  const auto made = parent->makeDirectory(kRecorderDirectory, kMode);
  if (!made) return made.error();
  // The creation mask may have left it closed to those who are to send.
  if (::fchmod(made->descriptor(), kMode) != 0) {
    return systemError("cannot set the mode of", made->path());
  }
  return openSocketDirectory(root, owners);
}

sockaddr_un socketAddress(const Directory& directory, std::string_view name) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  // Through the descriptor: a socket's address holds 107 bytes, and the path may be replaced.
  const std::string path = fmt::format("/proc/self/fd/{}/{}", directory.descriptor(), name);
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

Result<bool> isServed(const Directory& directory, const RecorderSocket& socket) {
  const std::string path = directory.pathOf(socket.name);
  struct stat status {};
  if (::fstatat(directory.descriptor(), socket.name, &status, AT_SYMLINK_NOFOLLOW) != 0) {
    return systemError("cannot examine", path);
  }
  if (!S_ISSOCK(status.st_mode)) return Error{path + " is not a socket", ENOTSOCK};
  const int type = socket.kind == RecorderSocket::Kind::Datagrams ? SOCK_DGRAM : SOCK_STREAM;
  const Descriptor probe(::socket(AF_UNIX, type | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  if (!probe) return Error{fmt::format("cannot make a socket: {}", std::strerror(errno)), errno};
  const sockaddr_un address = socketAddress(directory, socket.name);
  const auto connected = retried([&] {
    return ::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
  });
  // Too many wait already, or a socket of another type: somebody is there.
  if (connected == 0 || errno == EAGAIN || errno == EPROTOTYPE) return true;
  if (errno == ECONNREFUSED) return false;
  return systemError("cannot connect to", path);
}

}  // namespace tally
