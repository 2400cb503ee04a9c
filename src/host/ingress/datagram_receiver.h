// Reads datagrams, many with one call.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "base/result.h"
#include "host/ingress/drain_pace.h"
#include "host/ingress/listening_sockets.h"
#include "host/ingress/poll_set.h"
#include "platform/recording/ingress.h"

namespace tally {

// The queue of a UNIX socket is short, and its senders wait or lose datagrams while it is full. So
// all that has arrived is taken out first and handed over then. Each datagram has a slot for the
// longest one; memory is used for what arrives.
class DatagramReceiver {
 public:
  static constexpr std::size_t kLongestDatagram = 64u << 10;

  // Borrows the poll set for its life.
  static Result<DatagramReceiver> create(PollSet& poll);
  DatagramReceiver(DatagramReceiver&&) noexcept;
  DatagramReceiver& operator=(DatagramReceiver&&) = delete;
  ~DatagramReceiver();

  // Borrows the descriptor and has the poll set watch it. False with errno if that fails.
  bool add(const ListeningSocket& socket);
  // Hands over what the socket has that the poll set has under this index, at most so many
  // datagrams as there are slots. Times are nanoseconds of CLOCK_BOOTTIME. An error: the socket
  // does not work any longer.
  Status serve(std::uint32_t index, std::int64_t now, IngressHandler& handler);
  // The same for sockets that were left alone for a moment, if that is over.
  Status servePaused(std::int64_t now, IngressHandler& handler);
  // When the first of those is due.
  std::optional<std::int64_t> due() const;
  // The same for all sockets.
  Status serveAll(IngressHandler& handler);
  // Whether slots hold memory that is worth returning when nothing arrives for a while.
  bool holdsMemory() const { return holdsMemory_; }
  void releaseMemory();

 private:
  static constexpr std::size_t kSlots = 64;
  struct Socket {
    int descriptor;
    bool hasCredentials;
    std::uint32_t dropped;  // as the kernel counts, of UDP
    bool isDeep;            // its queue holds what comes during a pause
    DrainPace pace = {};
    std::optional<std::int64_t> pausedUntil = {};  // the poll set does not watch it
  };
  // No space for anything but the credentials: descriptors that a sender passes along are then
  // closed by the kernel and never arrive.
  static constexpr std::size_t kControlSize = CMSG_SPACE(sizeof(ucred));
  struct Headers {
    std::array<mmsghdr, kSlots> messages;
    std::array<iovec, kSlots> buffers;
    struct alignas(cmsghdr) Control {
      std::byte bytes[kControlSize];
    };
    std::array<Control, kSlots> controls;
  };

  DatagramReceiver(PollSet& poll, std::byte* slab);
  Result<std::size_t> drain(Socket& socket, IngressHandler& handler);
  Result<std::size_t> receive(const Socket& socket);
  void handOver(Socket& socket, mmsghdr& message, IngressHandler& handler);

  PollSet& poll_;
  std::vector<Socket> sockets_;
  std::unique_ptr<Headers> headers_;
  std::byte* slab_;
  bool holdsMemory_ = false;
};

}  // namespace tally
