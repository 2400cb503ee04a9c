#include "host/system/journal_socket.h"

#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>

#include <cerrno>
#include <chrono>
#include <cstdint>
#include <cstring>

namespace tally {
namespace {

constexpr timeval kPatience{.tv_sec = 1, .tv_usec = 0};
constexpr std::chrono::nanoseconds kMostWaited = std::chrono::milliseconds(900);

std::int64_t nanosecondsNow() {
  return std::chrono::nanoseconds(std::chrono::steady_clock::now().time_since_epoch()).count();
}

void appendLength(std::string& entry, std::uint64_t length) {
  for (unsigned byte = 0; byte < sizeof length; ++byte) {  // little endian
    entry += static_cast<char>(length >> (8 * byte) & 0xff);
  }
}

}  // namespace

std::string journalEntry(std::span<const JournalField> fields) {
  std::string entry;
  std::size_t size = 0;
  for (const auto& [name, value] : fields) {
    size += name.size() + value.size() + sizeof "\n\n" + sizeof(std::uint64_t);
  }
  entry.reserve(size);
  for (const auto& [name, value] : fields) {
    entry += name;
    if (value.find('\n') == std::string_view::npos) {
      entry += '=';
    } else {
      entry += '\n';
      appendLength(entry, value.size());
    }
    entry += value;
    entry += '\n';
  }
  return entry;
}

JournalSocket::JournalSocket(std::string path)
    : path_(std::move(path)), socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
  if (socket_) {
    (void)::setsockopt(socket_.get(), SOL_SOCKET, SO_SNDTIMEO, &kPatience, sizeof kPatience);
  }
}

bool JournalSocket::send(std::string_view entry) {
  sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
  if (!socket_ || path_.size() >= sizeof address.sun_path) return false;
  std::memcpy(address.sun_path, path_.data(), path_.size());
  const std::int64_t begin = nanosecondsNow();
  if (begin - minute_ > std::chrono::nanoseconds(std::chrono::minutes(1)).count()) {
    minute_ = begin;
    waited_ = 0;
  }
  const int flags = MSG_NOSIGNAL | (waited_ < kMostWaited.count() ? 0 : MSG_DONTWAIT);
  const auto sent = retried([&] {
    return ::sendto(socket_.get(), entry.data(), entry.size(), flags,
                    reinterpret_cast<const sockaddr*>(&address), sizeof address);
  });
  waited_ += nanosecondsNow() - begin;
  return sent >= 0;
}

}  // namespace tally
