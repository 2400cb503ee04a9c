// Reads datagrams, many with one call.
#pragma once

#include <netinet/in.h>
#include <sys/socket.h>

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "base/result.h"
#include "host/ingress/listening_sockets.h"
#include "platform/recording/ingress.h"

namespace tally {

// The queue of a UNIX socket is short, and its senders wait or lose datagrams while it is full. So
// all that has arrived is taken out first and handed over then. Each datagram has a slot for the
// longest one; memory is used for what arrives.
class DatagramReceiver {
 public:
  static constexpr std::size_t kLongestDatagram = 64u << 10;

  static Result<DatagramReceiver> create();
  DatagramReceiver(DatagramReceiver&&) noexcept;
  DatagramReceiver& operator=(DatagramReceiver&&) = delete;
  ~DatagramReceiver();

  // Borrows the descriptor.
  void add(const ListeningSocket& socket);
  std::size_t socketCount() const { return sockets_.size(); }
  // Hands over what the socket has, at most so many datagrams as there are slots. True if more may
  // be there. An error: the socket does not work any longer.
  Result<bool> drain(std::size_t socket, IngressHandler& handler);
  // The same for all of them.
  Status drainAll(IngressHandler& handler);
  // Whether slots hold memory that is worth returning when nothing arrives for a while.
  bool holdsMemory() const { return holdsMemory_; }
  void releaseMemory();

 private:
  static constexpr std::size_t kSlots = 256;
  struct Socket {
    int descriptor;
    bool hasCredentials;
    std::uint32_t dropped;  // as the kernel counts, of UDP
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

  explicit DatagramReceiver(std::byte* slab);
  Result<std::size_t> receive(const Socket& socket);
  void handOver(Socket& socket, mmsghdr& message, IngressHandler& handler);

  std::vector<Socket> sockets_;
  std::unique_ptr<Headers> headers_;
  std::byte* slab_;
  bool holdsMemory_ = false;
};

}  // namespace tally
