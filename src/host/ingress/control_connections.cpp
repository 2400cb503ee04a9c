#include "host/ingress/control_connections.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>

namespace tally {
namespace {

constexpr std::size_t kLongestRequest = 256;
constexpr std::size_t kLongestAnswer = 4u << 20;
constexpr std::int64_t kPatience = 10'000'000'000;

PollTag tagOf(std::uint32_t index) { return {PollTag::Kind::Control, index}; }

}  // namespace

void ControlConnections::add(Descriptor socket, std::int64_t now) {
  ucred peer{};
  socklen_t size = sizeof peer;
  if (::getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return;
  if (peer.uid != 0 && peer.uid != ::geteuid()) {
    return log_.fault("control: refused user", "control: user {} may not ask the recorder",
                      peer.uid);
  }
  const auto free = std::find_if(connections_.begin(), connections_.end(),
                                 [](const Connection& c) { return c.state == State::Free; });
  const auto index = static_cast<std::uint32_t>(free - connections_.begin());
  if (free == connections_.end() || !poll_.add(socket.get(), tagOf(index))) {
    return log_.fault("control: too many clients", "control: too many clients at once");
  }
  *free = Connection{State::Reads, std::move(socket), ++lastRequest_, now + kPatience, {}, 0};
}

void ControlConnections::serve(std::uint32_t index, std::uint32_t events, IngressHandler& handler) {
  Connection& connection = connections_[index];
  if (connection.state == State::Reads) return read(index, handler);
  if (connection.state == State::Writes) return write(index);
  // The client has gone, and with it the question.
  if ((events & (EPOLLHUP | EPOLLERR)) != 0) connection = {};
}

void ControlConnections::read(std::uint32_t index, IngressHandler& handler) {
  Connection& connection = connections_[index];
  char piece[kLongestRequest + 1];
  const auto count = retried([&] {
    return ::recv(connection.socket.get(), piece, sizeof piece - connection.text.size(),
                  MSG_DONTWAIT);
  });
  if (count < 0 && errno == EAGAIN) return;
  if (count > 0) connection.text.append(piece, static_cast<std::size_t>(count));
  const std::size_t end = connection.text.find('\n');
  const bool ended = count == 0 && !connection.text.empty();
  if (end == std::string::npos && !ended) {
    if (count <= 0 || connection.text.size() > kLongestRequest) connection = {};
    return;
  }
  const std::string line = connection.text.substr(0, end);
  connection.text.clear();
  connection.state = State::WaitsForAnswer;
  // Reports once that the client has gone, and nothing else.
  if (!poll_.change(connection.socket.get(), tagOf(index), EPOLLET)) {
    connection = {};
    return;
  }
  handler.onControl(connection.request, line);
}

void ControlConnections::answer(ControlRequest request, std::string_view text, std::int64_t now) {
  for (std::uint32_t index = 0; index < kMost; ++index) {
    Connection& connection = connections_[index];
    if (connection.state != State::WaitsForAnswer || connection.request != request) continue;
    if (text.size() > kLongestAnswer) {
      log_.fault("control: long answer", "control: an answer of {} bytes is not sent", text.size());
      text = "failed: the answer is too long\n";
    }
    connection.text = text;
    connection.state = State::Writes;
    connection.deadline = now + kPatience;
    return write(index);
  }
}

void ControlConnections::write(std::uint32_t index) {
  Connection& connection = connections_[index];
  while (connection.written < connection.text.size()) {
    const auto count = retried([&] {
      return ::send(connection.socket.get(), connection.text.data() + connection.written,
                    connection.text.size() - connection.written, MSG_DONTWAIT | MSG_NOSIGNAL);
    });
    if (count < 0 && errno == EAGAIN &&
        poll_.change(connection.socket.get(), tagOf(index), EPOLLOUT)) {
      return;
    }
    if (count < 0) break;
    connection.written += static_cast<std::size_t>(count);
  }
  connection = {};
}

std::optional<std::int64_t> ControlConnections::deadline() const {
  std::optional<std::int64_t> first;
  for (const Connection& each : connections_) {
    if (each.state != State::Reads && each.state != State::Writes) continue;
    first = std::min(first.value_or(each.deadline), each.deadline);
  }
  return first;
}

void ControlConnections::closeLate(std::int64_t now) {
  for (Connection& each : connections_) {
    const bool slow = each.state == State::Reads || each.state == State::Writes;
    if (slow && each.deadline <= now) each = {};
  }
}

bool ControlConnections::empty() const {
  return std::all_of(connections_.begin(), connections_.end(),
                     [](const Connection& c) { return c.state == State::Free; });
}

}  // namespace tally
