// Addresses of UDP sockets: those of this machine alone are served.
#pragma once

#include <sys/socket.h>

#include <string>

#include "base/result.h"

namespace tally {

struct UdpAddress {
  sockaddr_storage storage{};
  socklen_t size = 0;
};

// "127.0.0.1:8125", "[::1]:8125". An error for anything else: anybody on the network could write
// into the device's log.
Result<UdpAddress> parseLoopback(const std::string& text);
// Whether it is in 127.0.0.0/8 or is ::1.
bool isLoopback(const sockaddr_storage& address);
std::string addressText(const sockaddr_storage& address);

}  // namespace tally
