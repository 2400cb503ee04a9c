#include "tools/record/recorder_client.h"

#include <fmt/core.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <thread>

#include "base/files/device_root.h"
#include "tallyclient/tallyclient.h"

namespace tally::tools {
namespace {

using std::chrono::steady_clock;
constexpr std::chrono::seconds kQueuePatience{5};
constexpr std::chrono::milliseconds kLongestPause{20};

constexpr std::size_t kBufferBytes = 8000;  // fewer than the library's buffer has for lines
constexpr std::size_t kNumberBytes = 36;    // a value with its separators
constexpr std::size_t kSamplesAtOnce = 64;

}  // namespace

void RecorderClient::Close::operator()(tallyclient* client) const { tallyclient_close(client); }

Result<RecorderClient> RecorderClient::open(const std::string& root) {
  RecorderClient made;
  made.path_ = DeviceRoot(root).prefix() + "/run/tallyd/statsd.sock";
  made.client_.reset(tallyclient_open(made.path_.c_str()));
  if (made.client_ == nullptr) {
    const int fault = errno;
    return Error{fmt::format("cannot use the socket {}: {}", made.path_, std::strerror(fault)),
                 fault};
  }
  return made;
}

bool RecorderClient::accepts(const std::string& key) const {
  return key.find('\0') == std::string::npos &&
         tallyclient_push_many(client_.get(), key.c_str(), nullptr, 0) == 0;
}

Status RecorderClient::set(const std::string& key, std::int64_t value) {
  // A negative gauge takes two lines.
  if (Status space = makeSpace(2 * (key.size() + kNumberBytes)); !space) return space;
  return taken(tallyclient_set(client_.get(), key.c_str(), value));
}

Status RecorderClient::add(const std::string& key, std::int64_t amount) {
  if (Status space = makeSpace(key.size() + kNumberBytes); !space) return space;
  return taken(tallyclient_add(client_.get(), key.c_str(), amount));
}

Status RecorderClient::push(const std::string& key, std::span<const double> values) {
  while (!values.empty()) {
    const auto some = values.first(std::min(values.size(), kSamplesAtOnce));
    if (Status space = makeSpace(key.size() + some.size() * kNumberBytes); !space) return space;
    const int fault = tallyclient_push_many(client_.get(), key.c_str(), some.data(), some.size());
    if (Status done = taken(fault); !done) return done;
    values = values.subspan(some.size());
  }
  return Done{};
}

Status RecorderClient::deliver() {
  const auto end = steady_clock::now() + kQueuePatience;
  std::chrono::milliseconds pause{1};
  int fault = tallyclient_flush(client_.get());
  while (fault == EAGAIN && steady_clock::now() < end) {
    std::this_thread::sleep_for(pause);
    pause = std::min(2 * pause, kLongestPause);
    fault = tallyclient_flush(client_.get());
  }
  if (fault == EAGAIN) {
    return Error{fmt::format("not recorded: the queue of {} was full for {} seconds", path_,
                             kQueuePatience.count()),
                 fault};
  }
  if (fault == ENOENT || fault == ECONNREFUSED) {
    return Error{fmt::format("not recorded: no metrics daemon listens at {}", path_), fault};
  }
  if (fault != 0) {
    return Error{fmt::format("not recorded: {}: {}", path_, std::strerror(fault)), fault};
  }
  waiting_ = 0;
  return Done{};
}

Status RecorderClient::makeSpace(std::size_t bytes) {
  if (waiting_ + bytes > kBufferBytes) {
    if (Status delivered = deliver(); !delivered) return delivered;
  }
  waiting_ += bytes;
  return Done{};
}

Status RecorderClient::taken(int fault) const {
  if (fault == 0) return Done{};
  return Error{fmt::format("not recorded: {}", std::strerror(fault)), fault};
}

}  // namespace tally::tools
