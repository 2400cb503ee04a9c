#include "host/ingress/stream_connections.h"

#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

namespace tally {
namespace {

// Of lines that are not complete: those of one user, and all, of which the last quarter is for
// users who have no more than a few kilobytes.
constexpr std::size_t kMostPartialOfUser = 1u << 20, kMostPartial = 4u << 20, kFewBytes = 16u << 10;

}  // namespace

StreamConnections::StreamConnections(PollSet& poll, std::size_t most) : poll_(poll), most_(most) {}

StreamConnections::~StreamConnections() {
  for (const Connection& each : connections_) {
    if (each.descriptor >= 0) ::close(each.descriptor);
  }
}

// A user with many connections leaves the last quarter of the places to others.
bool StreamConnections::isAdmitted(std::uint32_t user) const {
  constexpr std::size_t kFew = 16;
  if (count_ >= most_) return false;
  const auto found = users_.find(user);
  if (found == users_.end()) return true;
  const bool scarce = most_ - count_ < most_ / 4;
  return found->second.connections < (scarce ? kFew : kMostOfUser);
}

void StreamConnections::add(Descriptor socket, IngressHandler& handler) {
  ucred peer{};
  socklen_t size = sizeof peer;
  if (::getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) return;
  const Sender sender{peer.uid};
  if (!isAdmitted(peer.uid)) return handler.onLoss(IngressLoss::ConnectionLimit, sender, 1);
  if (free_.empty()) {
    free_.push_back(static_cast<std::uint32_t>(connections_.size()));
    connections_.emplace_back();
  }
  const std::uint32_t index = free_.back();
  if (!poll_.add(socket.get(), {PollTag::Kind::Stream, index})) {
    return handler.onLoss(IngressLoss::ConnectionLimit, sender, 1);
  }
  free_.pop_back();
  connections_[index].descriptor = socket.release();
  connections_[index].user = peer.uid;
  ++users_[peer.uid].connections;
  ++count_;
  if (!buffer_) buffer_ = std::make_unique<decltype(buffer_)::element_type>();
}

void StreamConnections::close(std::uint32_t index, IngressHandler& handler) {
  Connection& connection = connections_[index];
  if (connection.partial) handler.onLines({connection.user}, *connection.partial);
  dropPartial(connection);
  const auto user = users_.find(connection.user);
  if (--user->second.connections == 0) users_.erase(user);
  ::close(connection.descriptor);
  connection = {};
  free_.push_back(index);
  if (--count_ == 0) {
    buffer_.reset();
    connections_ = decltype(connections_)();
    free_ = decltype(free_)();
  }
}

std::size_t StreamConnections::read(std::uint32_t index, IngressHandler& handler) {
  if (index >= connections_.size() || connections_[index].descriptor < 0) return 0;
  Connection& connection = connections_[index];
  const PollTag tag{PollTag::Kind::Stream, index};
  const std::size_t quota = handler.streamQuota({connection.user});
  if (quota == 0) {
    // Removed altogether: a closed connection would be reported again and again otherwise.
    if (!connection.waits) poll_.remove(connection.descriptor);
    connection.waits = true;
    waiting_.push_back(index);
    return 0;
  }
  if (connection.waits && !poll_.add(connection.descriptor, tag)) {
    waiting_.push_back(index);
    return 0;
  }
  connection.waits = false;
  const std::size_t most = std::min(quota, buffer_->size());
  // Without space for descriptors, which the kernel closes if there are any.
  const auto count =
      retried([&] { return ::recv(connection.descriptor, buffer_->data(), most, MSG_DONTWAIT); });
  if (count > 0) {
    take(connection, {buffer_->data(), static_cast<std::size_t>(count)}, handler);
    return static_cast<std::size_t>(count);
  }
  if (count == 0 || (errno != EAGAIN && errno != ENOMEM)) close(index, handler);
  return 0;
}

void StreamConnections::take(Connection& connection, std::string_view text,
                             IngressHandler& handler) {
  const Sender sender{connection.user};
  if (connection.skipsLine || connection.partial) {
    const std::size_t end = text.find('\n');
    if (end == std::string_view::npos) return keep(connection, text, handler);
    if (connection.partial) {
      keep(connection, text.substr(0, end), handler);
      if (connection.partial) handler.onLines(sender, *connection.partial);
      dropPartial(connection);
    }
    connection.skipsLine = false;
    text.remove_prefix(end + 1);
  }
  const std::size_t whole = text.rfind('\n') + 1;
  if (whole > 0) handler.onLines(sender, text.substr(0, whole));
  if (whole < text.size()) keep(connection, text.substr(whole), handler);
}

// Adds to the line that is not complete; drops it if that becomes too long.
void StreamConnections::keep(Connection& connection, std::string_view text,
                             IngressHandler& handler) {
  if (connection.skipsLine || text.empty()) return;
  const std::size_t held = connection.partial ? connection.partial->capacity() : 0;
  const std::size_t size = (connection.partial ? connection.partial->size() : 0) + text.size();
  User& user = users_[connection.user];
  // Of what its own user takes up, so that one user cannot have the lines of others dropped.
  const std::size_t growth = size > held ? std::max(size, held * 2) - held : 0;
  const bool hasFew = user.partialBytes + growth <= kFewBytes;
  if (size > kLongestLine || user.partialBytes + growth > kMostPartialOfUser ||
      partialBytes_ + growth > (hasFew ? kMostPartial : kMostPartial / 4 * 3)) {
    dropPartial(connection);
    connection.skipsLine = true;
    return handler.onLoss(IngressLoss::LongLine, {connection.user}, 1);
  }
  if (!connection.partial) connection.partial = std::make_unique<std::string>();
  connection.partial->append(text);
  const std::size_t grown = connection.partial->capacity() - held;
  user.partialBytes += grown;
  partialBytes_ += grown;
}

void StreamConnections::dropPartial(Connection& connection) {
  if (!connection.partial) return;
  users_[connection.user].partialBytes -= connection.partial->capacity();
  partialBytes_ -= connection.partial->capacity();
  connection.partial.reset();
}

bool StreamConnections::resume(IngressHandler& handler) {
  constexpr std::size_t kMuch = 1u << 20;
  const std::vector<std::uint32_t> waited = std::exchange(waiting_, {});
  std::size_t bytes = 0;
  auto next = waited.begin();
  while (next != waited.end() && bytes < kMuch) bytes += read(*next++, handler);
  waiting_.insert(waiting_.begin(), next, waited.end());
  return next == waited.end();
}

void StreamConnections::readAll(IngressHandler& handler) {
  (void)resume(handler);
  for (std::uint32_t i = 0; i < connections_.size(); ++i) {
    if (connections_[i].descriptor >= 0 && !connections_[i].waits) read(i, handler);
  }
}

}  // namespace tally
