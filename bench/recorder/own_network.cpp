#include "recorder/own_network.h"

#include <net/if.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <fstream>

#include "recorder/daemon.h"

namespace tally::bench {
namespace {

constexpr const char* kQueueLength = "/proc/sys/net/unix/max_dgram_qlen";

}  // namespace

bool enterOwnNetwork() {
  if (::geteuid() != 0 || ::unshare(CLONE_NEWNET) != 0) return false;
  const int socket = ::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  ifreq request{};
  std::strcpy(request.ifr_name, "lo");
  request.ifr_flags = IFF_UP;
  require(::ioctl(socket, SIOCSIFFLAGS, &request) == 0, "no loopback device");
  ::close(socket);
  return true;
}

int queueLength() {
  int length = 0;
  std::ifstream(kQueueLength) >> length;
  return length;
}

void setQueueLength(int datagrams) {
  std::ofstream(kQueueLength) << datagrams << std::flush;
  require(queueLength() == datagrams, "net.unix.max_dgram_qlen cannot be set");
}

}  // namespace tally::bench
