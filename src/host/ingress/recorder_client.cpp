#include "host/ingress/recorder_client.h"

#include <fmt/core.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <thread>
#include <vector>

#include "base/printable.h"
#include "host/ingress/socket_directory.h"

namespace tally {
namespace {

using std::chrono::milliseconds;
using Clock = std::chrono::steady_clock;

constexpr std::size_t kLongestReply = 4u << 20;

bool isAbsent(const Error& error) {
  return error.systemError == ENOENT || error.systemError == ECONNREFUSED;
}

// The users as whom the recorder may run: root, the store's owner, and whoever asks.
std::vector<uid_t> recorderUsers(const DeviceRoot& root) {
  std::vector<uid_t> users = {0, ::geteuid()};
  struct stat status {};
  const auto home = root.open("/var/mobile");
  if (home && ::fstat(home->descriptor(), &status) == 0) users.push_back(status.st_uid);
  return users;
}

Error noAnswer(const std::string& path, std::string_view why) {
  return {fmt::format("the recorder at {} {}", path, why), ETIMEDOUT};
}

// A connection whose every wait ends at one time.
class Conversation {
 public:
  Conversation(std::string path, milliseconds patience)
      : path_(std::move(path)), end_(Clock::now() + patience) {}

  Status connect(const Directory& directory) {
    socket_ = Descriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!socket_) return systemError("cannot make a socket for", path_);
    const sockaddr_un address = socketAddress(directory, kControlSocket.name);
    while (::connect(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) !=
           0) {
      // Too many wait before it, which nothing reports the end of.
      constexpr milliseconds kPause{10};
      if (errno != EAGAIN && errno != EINTR) return systemError("cannot connect to", path_);
      if (left() <= milliseconds(0)) return noAnswer(path_, "does not take the connection");
      std::this_thread::sleep_for(std::min(kPause, left()));
    }
    return Done{};
  }

  // The user who began to listen.
  Status checkPeer(const std::vector<uid_t>& users) const {
    ucred peer{};
    socklen_t size = sizeof peer;
    if (::getsockopt(socket_.get(), SOL_SOCKET, SO_PEERCRED, &peer, &size) != 0) {
      return systemError("cannot identify the server of", path_);
    }
    if (std::find(users.begin(), users.end(), peer.uid) != users.end()) return Done{};
    return Error{fmt::format("{} is served by user {}, who is not trusted", path_, peer.uid),
                 EPERM};
  }

  Status send(std::string_view text) {
    while (!text.empty()) {
      const auto count =
          ::send(socket_.get(), text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
      if (count >= 0) {
        text.remove_prefix(static_cast<std::size_t>(count));
        continue;
      }
      if (errno != EAGAIN && errno != EINTR) return failed();
      if (auto ready = waitFor(POLLOUT); !ready) return ready;
    }
    return Done{};
  }

  Result<std::string> readToEnd() {
    std::string answer;
    char piece[16u << 10];
    for (;;) {
      const auto count = ::recv(socket_.get(), piece, sizeof piece, MSG_DONTWAIT);
      if (count == 0) return answer;
      if (count < 0 && errno != EAGAIN && errno != EINTR) return failed();
      if (count > 0) answer.append(piece, static_cast<std::size_t>(count));
      if (answer.size() > kLongestReply) return noAnswer(path_, "answers without an end");
      // Also while bytes come, slowly.
      if (auto ready = waitFor(POLLIN); !ready) return ready.error();
    }
  }

 private:
  milliseconds left() const {
    return std::chrono::duration_cast<milliseconds>(end_ - Clock::now());
  }
  Error failed() const {
    // It closed the connection: it ended, or does not take orders from this user.
    if (errno == EPIPE || errno == ECONNRESET) return noAnswer(path_, "does not answer this user");
    return systemError("cannot ask", path_);
  }
  Status waitFor(short event) const {
    pollfd ready{socket_.get(), event, 0};
    const auto time = std::max<milliseconds::rep>(left().count(), 0);
    if (time == 0 || ::poll(&ready, 1, static_cast<int>(time)) == 0) {
      return noAnswer(path_, "did not answer in time");
    }
    return Done{};
  }

  std::string path_;
  Clock::time_point end_;
  Descriptor socket_;
};

}  // namespace

Result<std::string> askRecorder(const DeviceRoot& root, std::string_view line,
                                milliseconds patience) {
  const std::vector<uid_t> users = recorderUsers(root);
  const auto directory = openSocketDirectory(root, users);
  if (!directory) return directory.error();
  Conversation conversation(directory->pathOf(kControlSocket.name), patience);
  if (auto done = conversation.connect(*directory); !done) return done.error();
  if (auto done = conversation.checkPeer(users); !done) return done.error();
  if (auto done = conversation.send(std::string(line) + "\n"); !done) return done.error();
  return conversation.readToEnd();
}

Result<bool> isRecorderServed(const DeviceRoot& root) {
  const auto unserved = unservedRecorderSockets(root);
  if (!unserved) return unserved.error();
  return std::ranges::find(*unserved, kDatagramSocket.name) == unserved->end();
}

Result<std::vector<std::string>> unservedRecorderSockets(const DeviceRoot& root) {
  std::vector<std::string> unserved;
  const auto directory = openSocketDirectory(root, recorderUsers(root));
  for (const RecorderSocket& socket : {kDatagramSocket, kStreamSocket, kControlSocket}) {
    const auto served = directory ? isServed(*directory, socket) : directory.error();
    // One that only others may ask is there.
    if (!served && !isAbsent(served.error()) && served.error().systemError != EACCES) {
      return served.error();
    }
    if (served ? !*served : isAbsent(served.error())) unserved.emplace_back(socket.name);
  }
  return unserved;
}

Result<bool> SocketRecorderLink::commit(milliseconds patience) {
  constexpr std::size_t kMostShown = 200;
  constexpr std::string_view kFailed = "failed: ";
  const auto answer = askRecorder(root_, "commit", patience);
  if (!answer && isAbsent(answer.error())) return false;
  if (!answer) return answer.error();
  std::string_view text = *answer;
  while (text.ends_with('\n')) text.remove_suffix(1);
  if (text == "done") return true;
  const bool failed = text.starts_with(kFailed);
  if (failed) text.remove_prefix(kFailed.size());
  const std::string shown = fitted(printable(text.substr(0, kMostShown)), kMostShown, "...");
  if (failed) return Error{"the recorder could not commit: " + shown};
  return Error{text.empty() ? "the recorder gave no answer"
                            : "the recorder gave an unknown answer: " + shown};
}

}  // namespace tally
