// The connections of the stream socket, and the lines in them.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "base/files/file.h"
#include "host/ingress/poll_set.h"
#include "platform/recording/ingress.h"

namespace tally {

// A user's streams are read as far as the handler permits; then the user waits, and nobody else.
class StreamConnections {
 public:
  static constexpr std::size_t kLongestLine = 64u << 10;
  static constexpr std::size_t kMostConnections = 4096, kMostOfUser = 1024;

  // Borrows both for its life. No more than `most` connections at a time.
  StreamConnections(PollSet& poll, std::size_t most);
  ~StreamConnections();
  StreamConnections(const StreamConnections&) = delete;
  StreamConnections& operator=(const StreamConnections&) = delete;

  // Takes a connection. One above the limits is closed.
  void add(Descriptor socket, IngressHandler& handler);
  // Reads once from the connection that the poll set has under this index; returns the bytes read.
  std::size_t read(std::uint32_t index, IngressHandler& handler);
  // Reads from those that had to wait and need not wait any longer. False if it has not come to all
  // of them, since much was read.
  bool resume(IngressHandler& handler);
  bool hasWaiting() const { return !waiting_.empty(); }
  // Reads from each connection once.
  void readAll(IngressHandler& handler);
  std::size_t size() const { return count_; }

 private:
  struct Connection {
    int descriptor = -1;
    std::uint32_t user = 0;
    std::unique_ptr<std::string> partial;  // the begin of a line whose rest has not come yet
    bool skipsLine = false;                // up to its end
    bool waits = false;
  };
  struct User {
    std::size_t connections = 0, partialBytes = 0;
  };

  bool isAdmitted(std::uint32_t user) const;
  void take(Connection& connection, std::string_view text, IngressHandler& handler);
  void keep(Connection& connection, std::string_view text, IngressHandler& handler);
  void dropPartial(Connection& connection);
  void close(std::uint32_t index, IngressHandler& handler);

  PollSet& poll_;
  const std::size_t most_;
  std::size_t count_ = 0, partialBytes_ = 0;
  std::vector<Connection> connections_;
  std::vector<std::uint32_t> free_, waiting_;
  std::unordered_map<std::uint32_t, User> users_;
  std::unique_ptr<std::array<char, 64u << 10>> buffer_;  // while there are connections
};

}  // namespace tally
