#include "host/ingress/listening_sockets.h"

#include <fcntl.h>
#include <fmt/core.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <string_view>

#include "base/printable.h"
#include "host/ingress/udp_address.h"

namespace tally {
namespace {

constexpr int kBacklog = 4096;  // the kernel takes its own limit if that is lower

std::string takeVariable(const char* name) {
  const char* const value = std::getenv(name);
  std::string text = value != nullptr ? value : "";
  ::unsetenv(name);
  return text;
}

std::optional<int> parseInteger(std::string_view text) {
  int number = 0;
  const auto [end, code] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (code != std::errc{} || end != text.data() + text.size()) return std::nullopt;
  return number;
}

int option(int socket, int name) {
  int value = -1;
  socklen_t size = sizeof value;
  return ::getsockopt(socket, SOL_SOCKET, name, &value, &size) == 0 ? value : -1;
}

Status setFlag(int socket, int name) {
  const int on = 1;
  if (::setsockopt(socket, SOL_SOCKET, name, &on, sizeof on) == 0) return Done{};
  return Error{fmt::format("cannot set up a socket: {}", std::strerror(errno)), errno};
}

// What is asked of the kernel for each datagram.
Status prepare(const ListeningSocket& socket) {
  if (socket.kind != RecorderSocket::Kind::Datagrams) return Done{};
  if (socket.hasCredentials) return setFlag(socket.descriptor.get(), SO_PASSCRED);
  auto counts = setFlag(socket.descriptor.get(), SO_RXQ_OVFL);
  // Not every kernel says what it dropped; metrics come all the same.
  return counts || counts.error().systemError != ENOPROTOOPT ? counts : Status(Done{});
}

struct SocketFacts {
  int family = -1, type = -1, protocol = -1;
  bool listens = false;
  sockaddr_storage address{};
  std::string path;  // of a UNIX socket; empty if it has none
};

std::optional<SocketFacts> factsOf(int descriptor) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0 || !S_ISSOCK(status.st_mode)) return std::nullopt;
  SocketFacts facts;
  facts.family = option(descriptor, SO_DOMAIN);
  facts.type = option(descriptor, SO_TYPE);
  facts.protocol = option(descriptor, SO_PROTOCOL);
  facts.listens = option(descriptor, SO_ACCEPTCONN) == 1;
  // A UNIX address may be longer than its own type by the zero that ends it.
  socklen_t size = sizeof facts.address;
  if (::getsockname(descriptor, reinterpret_cast<sockaddr*>(&facts.address), &size) != 0) {
    return std::nullopt;
  }
  if (facts.family == AF_UNIX && size > offsetof(sockaddr_un, sun_path)) {
    const char* const begin =
        reinterpret_cast<const char*>(&facts.address) + offsetof(sockaddr_un, sun_path);
    facts.path.assign(begin, ::strnlen(begin, size - offsetof(sockaddr_un, sun_path)));
  }
  return facts;
}

// Why the socket is not served; empty if it is.
std::string faultOf(const SocketFacts& facts) {
  if (facts.family == AF_UNIX) {
    if (facts.path.empty()) return "a UNIX socket without a path";
    if (facts.type == SOCK_DGRAM) return {};
    if (facts.type != SOCK_STREAM) return "a UNIX socket of neither datagrams nor a stream";
    return facts.listens ? "" : "a stream socket that does not listen";
  }
  if (facts.family != AF_INET && facts.family != AF_INET6) {
    return "a socket of neither UNIX nor UDP";
  }
  if (facts.type != SOCK_DGRAM || facts.protocol != IPPROTO_UDP) {
    return addressText(facts.address) + ", which is not UDP";
  }
  if (isLoopback(facts.address)) return {};
  return addressText(facts.address) + ", and only 127.0.0.0/8 and ::1 are served";
}

bool isControl(const SocketFacts& facts, std::string_view name) {
  const std::string_view path = facts.path;
  return name == "control" || path.substr(path.rfind('/') + 1) == kControlSocket.name;
}

Result<ListeningSocket> adopt(int number, std::string_view name) {
  const std::string what = fmt::format(
      "socket {}{} that was passed in", number,
      name.empty() ? std::string() : fmt::format(" ({})", fitted(printable(name), 64, "...")));
  const auto facts = factsOf(number);
  if (!facts) return Error{what + " is not a socket"};
  if (const std::string fault = faultOf(*facts); !fault.empty()) {
    return Error{fmt::format("{} is {}", what, printable(fault))};
  }
  ListeningSocket socket;
  socket.descriptor = Descriptor(number);
  socket.hasCredentials = facts->family == AF_UNIX;
  if (facts->type == SOCK_STREAM) {
    socket.kind =
        isControl(*facts, name) ? RecorderSocket::Kind::Control : RecorderSocket::Kind::Streams;
  }
  const int flags = ::fcntl(number, F_GETFL);
  if (flags < 0 || ::fcntl(number, F_SETFL, flags | O_NONBLOCK) != 0 ||
      ::fcntl(number, F_SETFD, FD_CLOEXEC) != 0) {
    return systemError("cannot set up", what);
  }
  if (auto prepared = prepare(socket); !prepared) return prepared.error();
  return socket;
}

// Only while the lock is held: nobody else removes what looks dead.
Status removeDead(const Directory& directory, const RecorderSocket& socket) {
  const auto served = isServed(directory, socket);
  if (!served) {
    return served.error().systemError == ENOENT ? Status(Done{}) : Status(served.error());
  }
  if (!*served) return directory.remove(socket.name);
  return Error{
      directory.pathOf(socket.name) + " is already served, by another tallyd or by systemd for it",
      EADDRINUSE};
}

Result<ListeningSocket> bindAt(const Directory& directory, const RecorderSocket& which,
                               SocketNames& names) {
  const std::string path = directory.pathOf(which.name);
  const bool datagrams = which.kind == RecorderSocket::Kind::Datagrams;
  ListeningSocket socket;
  socket.kind = which.kind;
  socket.hasCredentials = true;
  socket.descriptor = Descriptor(
      ::socket(AF_UNIX, (datagrams ? SOCK_DGRAM : SOCK_STREAM) | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  const int descriptor = socket.descriptor.get();
  // Set before it has a name, so that it never is open to more users than it should be; and again
  // afterwards, since the creation mask takes from it.
  if (descriptor < 0 || ::fchmod(descriptor, which.mode) != 0) {
    return systemError("cannot make", path);
  }
  if (auto prepared = prepare(socket); !prepared) return prepared.error();
  const sockaddr_un address = socketAddress(directory, which.name);
  if (::bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    return systemError("cannot make", path);
  }
  names.add(which.name);
  if (::fchmodat(directory.descriptor(), which.name, which.mode, 0) != 0) {
    return systemError("cannot set the mode of", path);
  }
  if (!datagrams && ::listen(descriptor, kBacklog) != 0) {
    return systemError("cannot listen on", path);
  }
  return socket;
}

Result<ListeningSocket> bindUdp(const std::string& text) {
  constexpr int kReceiveBuffer = 8 << 20;
  const auto address = parseLoopback(text);
  if (!address) return address.error();
  ListeningSocket socket;
  socket.descriptor = Descriptor(
      ::socket(address->storage.ss_family, SOCK_DGRAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
  const int descriptor = socket.descriptor.get();
  if (descriptor < 0) return systemError("cannot make a socket for", "UDP address " + text);
  // The system's limit for others holds unless this process may exceed it.
  for (const int name : {SO_RCVBUF, SO_RCVBUFFORCE}) {
    (void)::setsockopt(descriptor, SOL_SOCKET, name, &kReceiveBuffer, sizeof kReceiveBuffer);
  }
  if (auto prepared = prepare(socket); !prepared) return prepared.error();
  if (::bind(descriptor, reinterpret_cast<const sockaddr*>(&address->storage), address->size) !=
      0) {
    return systemError("cannot serve", "UDP address " + text);
  }
  return socket;
}

bool isSameFile(const FileIdentity& a, const FileIdentity& b) {
  return a.device == b.device && a.inode == b.inode;
}

}  // namespace

void SocketNames::add(std::string name) {
  if (const auto identity = directory_.identity(name)) {
    names_.push_back({std::move(name), *identity});
  }
}

SocketNames::~SocketNames() {
  for (const Name& each : names_) {
    const auto now = directory_.identity(each.name);
    if (now && isSameFile(*now, each.identity)) (void)directory_.remove(each.name);
  }
}

Result<std::optional<ListeningSockets>> takeActivatedSockets() {
  constexpr int kFirst = 3;
  constexpr int kMost = 64;
  const auto process = parseInteger(takeVariable("LISTEN_PID"));
  const std::string countText = takeVariable("LISTEN_FDS");
  const std::string allNames = takeVariable("LISTEN_FDNAMES");
  if (process != ::getpid() || countText.empty()) return std::optional<ListeningSockets>();
  const auto count = parseInteger(countText);
  if (!count || *count < 0 || *count > kMost) {
    return Error{fmt::format("LISTEN_FDS is {}, not a number of sockets up to {}",
                             fitted(printable(countText), 64, "..."), kMost)};
  }
  if (*count == 0) return std::optional<ListeningSockets>();
  ListeningSockets all;
  bool metrics = false;
  std::string_view left = allNames;
  for (int number = kFirst; number < kFirst + *count; ++number) {
    const std::string_view name = left.substr(0, left.find(':'));
    left.remove_prefix(std::min(name.size() + 1, left.size()));
    auto socket = adopt(number, name);
    if (!socket) return socket.error();
    metrics = metrics || socket->kind != RecorderSocket::Kind::Control;
    all.sockets.push_back(*std::move(socket));
  }
  if (!metrics) return Error{"none of the sockets that were passed in takes metrics"};
  return std::optional(std::move(all));
}

Result<ListeningSockets> openSockets(const DeviceRoot& root,
                                     const std::vector<std::string>& udpAddresses) {
  constexpr RecorderSocket kAll[] = {kDatagramSocket, kStreamSocket, kControlSocket};
  const auto directory = makeSocketDirectory(root, {0, ::geteuid()});
  if (!directory) return directory.error();
  auto lock = FileLock::acquire(*directory, "tallyd.lock", std::chrono::milliseconds(0));
  if (!lock && lock.error().systemError == EWOULDBLOCK) {
    return Error{"another tallyd serves this device root: " + lock.error().message, EWOULDBLOCK};
  }
  if (!lock) return lock.error();
  // Before anything is made: a refusal leaves all as it was.
  for (const RecorderSocket& socket : kAll) {
    if (auto removed = removeDead(*directory, socket); !removed) return removed.error();
  }
  ListeningSockets all;
  SocketNames& names = all.names.emplace(*directory, *std::move(lock));
  for (const RecorderSocket& which : kAll) {
    auto socket = bindAt(*directory, which, names);
    if (!socket) return socket.error();
    all.sockets.push_back(*std::move(socket));
  }
  for (const std::string& address : udpAddresses) {
    auto socket = bindUdp(address);
    if (!socket) return socket.error();
    all.sockets.push_back(*std::move(socket));
  }
  return all;
}

}  // namespace tally
