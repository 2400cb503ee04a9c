// The sockets that the recorder serves: handed in by systemd, or opened by itself.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/file.h"
#include "base/files/file_lock.h"
#include "base/result.h"
#include "host/ingress/socket_directory.h"

namespace tally {

struct ListeningSocket {
  Descriptor descriptor;  // does not block
  RecorderSocket::Kind kind = RecorderSocket::Kind::Datagrams;
  bool hasCredentials = false;  // the kernel says who sends
};

// Sockets of this process that have names in the device's directory. The destructor removes those
// names that still are of these sockets.
class SocketNames {
 public:
  SocketNames(Directory directory, FileLock lock)
      : directory_(std::move(directory)), lock_(std::move(lock)) {}
  SocketNames(SocketNames&&) = default;
  SocketNames& operator=(SocketNames&&) = delete;
  ~SocketNames();
  const Directory& directory() const { return directory_; }
  void add(std::string name);

 private:
  struct Name {
    std::string name;
    FileIdentity identity;
  };
  Directory directory_;
  FileLock lock_;  // held as long as the names are
  std::vector<Name> names_;
};

struct ListeningSockets {
  std::vector<ListeningSocket> sockets;
  std::optional<SocketNames> names;  // empty: they were handed in
};

// What systemd hands to this process, as its environment says; taken out of the environment. Empty
// if it hands in nothing. An error names the first one that the recorder must not serve: metrics
// come through UNIX sockets that have a path and through UDP on loopback addresses alone.
Result<std::optional<ListeningSockets>> takeActivatedSockets();

// The three sockets below the device root, and UDP sockets ("127.0.0.1:8125", "[::1]:8125"). An
// error if another program serves one of them; what a dead one left is replaced.
Result<ListeningSockets> openSockets(const DeviceRoot& root,
                                     const std::vector<std::string>& udpAddresses);

}  // namespace tally
