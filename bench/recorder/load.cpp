#include "recorder/load.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <signal.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <random>
#include <thread>

#include "recorder/daemon.h"

namespace tally::bench {
namespace {

using namespace std::chrono_literals;
using std::chrono::steady_clock;

struct Address {
  sockaddr_storage bytes{};
  socklen_t size = 0;
  const sockaddr* get() const { return reinterpret_cast<const sockaddr*>(&bytes); }
};

Address addressOf(const std::string& text) {
  Address address;
  if (text.starts_with("udp:")) {
    auto& udp = reinterpret_cast<sockaddr_in&>(address.bytes);
    udp.sin_family = AF_INET;
    udp.sin_port = htons(static_cast<std::uint16_t>(std::atoi(text.c_str() + 4)));
    udp.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.size = sizeof udp;
    return address;
  }
  auto& local = reinterpret_cast<sockaddr_un&>(address.bytes);
  local.sun_family = AF_UNIX;
  require(text.size() < sizeof local.sun_path, "the path is too long");
  std::memcpy(local.sun_path, text.c_str(), text.size() + 1);
  address.size = sizeof local;
  return address;
}

int datagramSocket(const Address& address) {
  const int socket = ::socket(address.bytes.ss_family, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  require(socket >= 0, "no socket");
  return socket;
}

// How far behind its schedule a sender may catch up. More would be a burst that no program sends.
constexpr auto kCatchesUp = 200us;

}  // namespace

std::vector<std::string> makeDatagrams(const Mix& mix, int perDatagram, std::int64_t metrics) {
  std::mt19937_64 random(1);
  std::lognormal_distribution<double> milliseconds(4.0, 1.0);
  const std::int64_t keys = mix.counters + mix.distributions;
  std::vector<std::string> datagrams(static_cast<std::size_t>(metrics / perDatagram));
  std::int64_t number = 0;
  for (std::string& datagram : datagrams) {
    for (int i = 0; i < perDatagram; ++i, ++number) {
      const std::int64_t key = number % keys;
      char line[96];
      const char* const end = i + 1 < perDatagram ? "\n" : "";
      if (key < mix.counters) {
        std::snprintf(line, sizeof line, "com.example.service.requests.%03d:%d|c%s",
                      static_cast<int>(key), 1 + static_cast<int>(number % 3), end);
      } else {
        const bool whole = mix.samples == Mix::Samples::WholeMilliseconds;
        std::snprintf(line, sizeof line, "com.example.service.latency.%02d:%.*g|ms%s",
                      static_cast<int>(key - mix.counters), 17,
                      whole ? static_cast<double>(static_cast<int>(milliseconds(random)))
                            : milliseconds(random),
                      end);
      }
      datagram += line;
    }
  }
  return datagrams;
}

Sender::Sender(const std::string& address, bool blocks) : blocks_(blocks) {
  const Address to = addressOf(address);
  socket_ = datagramSocket(to);
  require(::connect(socket_, to.get(), to.size) == 0, "cannot connect");
}

Sender::~Sender() { ::close(socket_); }

std::int64_t Sender::send(const std::vector<std::string>& datagrams, std::int64_t count,
                          double rate) {
  const int flags = MSG_NOSIGNAL | (blocks_ ? 0 : MSG_DONTWAIT);
  const auto step = std::chrono::nanoseconds(rate > 0 ? static_cast<long>(1e9 / rate) : 0);
  auto due = steady_clock::now();
  std::int64_t lost = 0;
  for (std::int64_t i = 0; i < count; ++i) {
    if (rate > 0) {
      auto now = steady_clock::now();
      while (now < due) now = steady_clock::now();
      due = std::max(due, now - kCatchesUp) + step;
    }
    const std::string& datagram = datagrams[static_cast<std::size_t>(i) % datagrams.size()];
    if (::send(socket_, datagram.data(), datagram.size(), flags) < 0) {
      require(errno == EAGAIN || errno == ENOBUFS || errno == ECONNREFUSED, "cannot send");
      ++lost;
    }
  }
  return lost;
}

BareReceiver::BareReceiver(const std::string& address) {
  const Address at = addressOf(address);
  socket_ = datagramSocket(at);
  require(::bind(socket_, at.get(), at.size) == 0, "cannot bind");
  void* const shared =
      ::mmap(nullptr, sizeof *count_, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
  require(shared != MAP_FAILED, "no memory");
  count_ = static_cast<volatile std::int64_t*>(shared);
  process_ = ::fork();
  if (process_ != 0) return;
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
  static char buffer[1 << 16];
  for (;;) {
    if (::recv(socket_, buffer, sizeof buffer, 0) >= 0) *count_ = *count_ + 1;
  }
}

BareReceiver::~BareReceiver() {
  ::kill(process_, SIGKILL);
  ::waitpid(process_, nullptr, 0);
  ::close(socket_);
}

std::int64_t BareReceiver::settled() const {
  std::int64_t before = -1;
  while (before != *count_) {
    before = *count_;
    std::this_thread::sleep_for(100ms);
  }
  return before;
}

}  // namespace tally::bench
