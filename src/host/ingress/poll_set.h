// The descriptors that the ingress waits for.
#pragma once

#include <poll.h>
#include <sys/epoll.h>
#include <time.h>

#include <algorithm>
#include <cstdint>
#include <optional>
#include <utility>

#include "base/files/file.h"
#include "base/result.h"

namespace tally {

// What a descriptor is for, and its index among those of its kind.
struct PollTag {
  enum class Kind : std::uint32_t {
    Wake,
    Signal,
    Deadline,
    ClockStep,
    Datagrams,
    StreamListener,
    ControlListener,
    Stream,
    Control,
  } kind;
  std::uint32_t index = 0;

  static PollTag of(const epoll_event& event) {
    return {static_cast<Kind>(event.data.u64 >> 32), static_cast<std::uint32_t>(event.data.u64)};
  }
};

class PollSet {
 public:
  static Result<PollSet> create() {
    Descriptor descriptor(::epoll_create1(EPOLL_CLOEXEC));
    if (!descriptor) return systemError("cannot make", "an epoll descriptor");
    return PollSet(std::move(descriptor));
  }

  // False with errno when the kernel has no memory for it.
  bool add(int descriptor, PollTag tag, std::uint32_t events = EPOLLIN) {
    return control(EPOLL_CTL_ADD, descriptor, tag, events);
  }
  bool change(int descriptor, PollTag tag, std::uint32_t events) {
    return control(EPOLL_CTL_MOD, descriptor, tag, events);
  }
  void remove(int descriptor) {
    (void)::epoll_ctl(descriptor_.get(), EPOLL_CTL_DEL, descriptor, nullptr);
  }
  // As epoll_wait, for so many nanoseconds at most; empty: for ever.
  int wait(epoll_event* events, int most, std::optional<std::int64_t> nanoseconds) {
    constexpr std::int64_t kMillisecond = 1'000'000, kLongest = 1'000'000 * kMillisecond;
    const std::int64_t time = std::clamp<std::int64_t>(nanoseconds.value_or(0), 0, kLongest);
    int milliseconds =
        nanoseconds ? static_cast<int>((time + kMillisecond - 1) / kMillisecond) : -1;
    if (nanoseconds && time < kMillisecond) {
      pollfd ready{descriptor_.get(), POLLIN, 0};
      const timespec shortTime{0, static_cast<long>(time)};
      (void)::ppoll(&ready, 1, &shortTime, nullptr);
      milliseconds = 0;
    }
    return ::epoll_wait(descriptor_.get(), events, most, milliseconds);
  }

 private:
  explicit PollSet(Descriptor descriptor) : descriptor_(std::move(descriptor)) {}
  bool control(int operation, int descriptor, PollTag tag, std::uint32_t events) {
    epoll_event event{};
    event.events = events;
    event.data.u64 = std::uint64_t{static_cast<std::uint32_t>(tag.kind)} << 32 | tag.index;
    return ::epoll_ctl(descriptor_.get(), operation, descriptor, &event) == 0;
  }
  Descriptor descriptor_;
};

}  // namespace tally
