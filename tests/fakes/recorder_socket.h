// The datagram socket of a metrics daemon, which reads only when the test says so.
#pragma once

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

namespace tally::fakes {

class RecorderSocket {
 public:
  explicit RecorderSocket(std::string path) : path_(std::move(path)) {}
  ~RecorderSocket() { unbind(); }
  RecorderSocket(const RecorderSocket&) = delete;
  RecorderSocket& operator=(const RecorderSocket&) = delete;

  void bind() {
    socket_ = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, path_.c_str());
    ASSERT_EQ(::bind(socket_, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  }
  void unbind() {
    if (socket_ >= 0) ::close(socket_);
    std::filesystem::remove(path_);
    socket_ = -1;
  }
  const std::string& path() const { return path_; }
  int descriptor() const { return socket_; }

  // The datagrams that wait in the queue, which must consist of whole lines.
  std::vector<std::string> datagrams() const {
    std::vector<std::string> found;
    std::string buffer(100'000, '\0');
    for (ssize_t size; (size = ::recv(socket_, buffer.data(), buffer.size(), 0)) >= 0;) {
      EXPECT_LE(size, 8192);
      found.push_back(buffer.substr(0, static_cast<std::size_t>(size)));
      EXPECT_TRUE(found.back().ends_with('\n'));
    }
    return found;
  }
  std::string received() const {
    std::string all;
    for (const std::string& datagram : datagrams()) all += datagram;
    return all;
  }

 private:
  std::string path_;
  int socket_ = -1;
};

}  // namespace tally::fakes
