// The connections of the control socket.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "base/files/file.h"
#include "host/ingress/poll_set.h"
#include "platform/recording/ingress.h"
#include "platform/system_log.h"

namespace tally {

// A client sends one line and gets one answer, each within ten seconds. Times are nanoseconds of
// CLOCK_BOOTTIME.
class ControlConnections {
 public:
  // Borrows both for its life.
  ControlConnections(PollSet& poll, SystemLog& log) : poll_(poll), log_(log) {}

  // Takes a connection, if its client is root or the program's own user and not too many are there.
  void add(Descriptor socket, std::int64_t now);
  // Reads or writes what the connection under this index is ready for.
  void serve(std::uint32_t index, std::uint32_t events, IngressHandler& handler);
  void answer(ControlRequest request, std::string_view text, std::int64_t now);
  // When the next of them has been too slow; those are closed.
  std::optional<std::int64_t> deadline() const;
  void closeLate(std::int64_t now);
  bool empty() const;

 private:
  enum class State { Free, Reads, WaitsForAnswer, Writes };
  struct Connection {
    State state = State::Free;
    Descriptor socket;
    ControlRequest request = 0;
    std::int64_t deadline = 0;
    std::string text;  // the line, then the answer
    std::size_t written = 0;
  };

  void read(std::uint32_t index, IngressHandler& handler);
  void write(std::uint32_t index);

  static constexpr std::size_t kMost = 8;
  PollSet& poll_;
  SystemLog& log_;
  std::array<Connection, kMost> connections_;
  ControlRequest lastRequest_ = 0;
};

}  // namespace tally
