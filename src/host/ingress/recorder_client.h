// Asks the recorder that serves a device root.
#pragma once

#include <chrono>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "base/files/device_root.h"
#include "base/result.h"
#include "platform/recording/recorder_link.h"

namespace tally {

// Sends a line to the recorder's control socket and returns its answer, of at most 4 MiB. Waits at
// most so long in all. An error: ENOENT or ECONNREFUSED when there is no recorder; any other when
// it does not answer, when its socket may be that of another user, who could answer as well, or
// when this user may not ask.
Result<std::string> askRecorder(const DeviceRoot& root, std::string_view line,
                                std::chrono::milliseconds patience);

// Whether somebody takes what is sent to the socket of datagrams: the recorder, or systemd, which
// starts it then. False if there is no such socket. An error if it cannot be trusted or examined.
Result<bool> isRecorderServed(const DeviceRoot& root);

// The names of its UNIX sockets that nobody serves; an error as above.
Result<std::vector<std::string>> unservedRecorderSockets(const DeviceRoot& root);

// Has the recorder commit.
class SocketRecorderLink final : public RecorderLink {
 public:
  explicit SocketRecorderLink(DeviceRoot root) : root_(std::move(root)) {}
  Result<bool> commit(std::chrono::milliseconds patience) override;

 private:
  DeviceRoot root_;
};

}  // namespace tally
