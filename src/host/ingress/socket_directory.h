// Where the recorder's sockets are, and the check of the directory that holds them.
#pragma once

#include <sys/types.h>
#include <sys/un.h>

#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/directory.h"
#include "base/result.h"

namespace tally {

inline constexpr std::string_view kRecorderParent = "/run";
inline constexpr std::string_view kRecorderDirectory = "tallyd";  // in the one above

struct RecorderSocket {
  enum class Kind { Datagrams, Streams, Control } kind;
  const char* name;
  unsigned mode;
};
// Anybody may send metrics. Only root and the recorder's user may ask it for something.
inline constexpr RecorderSocket kDatagramSocket = {RecorderSocket::Kind::Datagrams, "statsd.sock",
                                                   0666};
inline constexpr RecorderSocket kStreamSocket = {RecorderSocket::Kind::Streams,
                                                 "statsd-stream.sock", 0666};
inline constexpr RecorderSocket kControlSocket = {RecorderSocket::Kind::Control, "control.sock",
                                                  0600};

// The directory of the sockets. An error (ENOENT) when it is missing; an error as well if it, or
// the one above, is a link, belongs to a user who is not among `owners`, or can be written by
// others: they could put sockets of their own there.
Result<Directory> openSocketDirectory(const DeviceRoot& root, const std::vector<uid_t>& owners);
// The same; made with mode 0755 if it is missing.
Result<Directory> makeSocketDirectory(const DeviceRoot& root, const std::vector<uid_t>& owners);

// The address of a socket in an open directory, however long the directory's path is.
// REQUIRES: the name has at most 64 bytes.
sockaddr_un socketAddress(const Directory& directory, std::string_view name);

// Whether somebody serves the socket of this name and kind: connects to it. ENOENT if there is
// none, ENOTSOCK if something else has the name.
Result<bool> isServed(const Directory& directory, const RecorderSocket& socket);

}  // namespace tally
