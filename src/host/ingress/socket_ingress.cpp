#include "host/ingress/socket_ingress.h"

#include <fmt/core.h>
#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/resource.h>
#include <sys/signalfd.h>
#include <sys/timerfd.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <limits>
#include <optional>
#include <utility>

#include "host/ingress/control_connections.h"
#include "host/ingress/datagram_receiver.h"
#include "host/ingress/listening_sockets.h"
#include "host/ingress/poll_set.h"
#include "host/ingress/stream_connections.h"

namespace tally {
namespace {

using Kind = PollTag::Kind;

constexpr std::int64_t kMillisecond = 1'000'000;
// How long a connection waits that may not be read, at most.
constexpr std::int64_t kWaitingTime = 50 * kMillisecond;
// Without traffic for so long, memory of earlier datagrams is returned.
constexpr std::int64_t kQuietTime = 1000 * kMillisecond;

std::int64_t bootNanoseconds() {
  timespec now{};
  ::clock_gettime(CLOCK_BOOTTIME, &now);
  return std::int64_t{now.tv_sec} * 1'000'000'000 + now.tv_nsec;
}

double wallSeconds() {
  timespec now{};
  ::clock_gettime(CLOCK_REALTIME, &now);
  return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

Status setTimer(int timer, int flags, std::int64_t seconds, std::int64_t nanoseconds) {
  itimerspec value{};
  value.it_value.tv_sec = static_cast<time_t>(seconds);
  value.it_value.tv_nsec = static_cast<long>(nanoseconds);
  // Cancelled: it is set, and the clock was since the last look at it, which its reader sees too.
  if (::timerfd_settime(timer, flags, &value, nullptr) == 0 || errno == ECANCELED) return Done{};
  return systemError("cannot set", "a timer");
}

// Takes what an eventfd or a timerfd counted.
void takeCount(int descriptor) {
  std::uint64_t count = 0;
  // Also fails when the clock was set, which is what the reader wants to know of.
  if (::read(descriptor, &count, sizeof count) < 0) return;
}

// How many stream connections the limit of descriptors leaves space for.
std::size_t raiseDescriptorLimit() {
  constexpr rlim_t kOthers = 64;  // of the store, the control socket and the loop
  rlimit limit{};
  if (::getrlimit(RLIMIT_NOFILE, &limit) != 0) return kOthers;
  if (limit.rlim_cur < limit.rlim_max) {
    const rlimit raised{limit.rlim_max, limit.rlim_max};
    if (::setrlimit(RLIMIT_NOFILE, &raised) == 0) limit = raised;
  }
  const rlim_t left = limit.rlim_cur > 2 * kOthers ? limit.rlim_cur - kOthers : kOthers;
  return static_cast<std::size_t>(std::min<rlim_t>(left, StreamConnections::kMostConnections));
}

// Signals that are read from a descriptor instead of ending the process.
class TakenSignals {
 public:
  TakenSignals() {
    sigset_t set{};
    ::sigemptyset(&set);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP}) ::sigaddset(&set, signal);
    ::pthread_sigmask(SIG_BLOCK, &set, &before_);
    descriptor_ = Descriptor(::signalfd(-1, &set, SFD_NONBLOCK | SFD_CLOEXEC));
  }
  ~TakenSignals() { ::pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
  TakenSignals(const TakenSignals&) = delete;
  TakenSignals& operator=(const TakenSignals&) = delete;
  int descriptor() const { return descriptor_.get(); }
  // The next one that came; 0 if none did.
  int take() {
    signalfd_siginfo info{};
    if (::read(descriptor_.get(), &info, sizeof info) != sizeof info) return 0;
    return static_cast<int>(info.ssi_signo);
  }

 private:
  Descriptor descriptor_;
  sigset_t before_{};
};

class SocketIngress final : public Ingress {
 public:
  SocketIngress(ListeningSockets sockets, std::unique_ptr<PollSet> poll, DatagramReceiver datagrams,
                SystemLog& log)
      : sockets_(std::move(sockets)),
        ownedPoll_(std::move(poll)),
        poll_(*ownedPoll_),
        datagrams_(std::move(datagrams)),
        streams_(poll_, raiseDescriptorLimit()),
        control_(poll_, log),
        wake_(::eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
        deadline_(::timerfd_create(CLOCK_BOOTTIME, TFD_NONBLOCK | TFD_CLOEXEC)),
        clockStep_(::timerfd_create(CLOCK_REALTIME, TFD_NONBLOCK | TFD_CLOEXEC)) {}

  Status start();
  Status run(IngressHandler& handler) override;
  void stop() override {
    stopped_ = true;
    wake();
  }
  void wake() override {
    const std::uint64_t one = 1;
    // Fails only when it is due to wake up anyway.
    if (::write(wake_.get(), &one, sizeof one) < 0) return;
  }
  void answer(ControlRequest request, std::string_view text) override {
    control_.answer(request, text, now_);
  }
  void stopReading() override { stoppedReading_ = true; }
  bool hasConnections() const override { return streams_.size() > 0 || !control_.empty(); }
  bool isActivated() const override { return !sockets_.names; }

 private:
  static constexpr int kMostEvents = 64;
  using Events = std::array<epoll_event, kMostEvents>;

  Status serve(const Events& events, int count, IngressHandler& handler);
  Result<int> wait(Events& events);
  Result<int> waitForWake();
  std::optional<std::int64_t> waitingTime() const;
  Status serveDatagrams(const Events& events, int count, IngressHandler& handler);
  Status serveConnections(const Events& events, int count, IngressHandler& handler);
  void serveListeners(const Events& events, int count, IngressHandler& handler);
  Status serveSignals(IngressHandler& handler);
  Status takeEverything(IngressHandler& handler);
  void accept(std::uint32_t listener, bool isControl, IngressHandler& handler);
  bool watch(std::uint32_t listener);
  Status setDeadline(std::optional<std::int64_t> delay);

  TakenSignals signals_;
  ListeningSockets sockets_;
  std::unique_ptr<PollSet> ownedPoll_;  // stays in its place
  PollSet& poll_;
  DatagramReceiver datagrams_;
  StreamConnections streams_;
  ControlConnections control_;
  Descriptor wake_, deadline_, clockStep_;
  std::atomic<bool> stopped_ = false;
  bool stoppedReading_ = false, signalled_ = false;
  std::int64_t now_ = 0;      // when the round began
  std::int64_t resumed_ = 0;  // when connections that wait were last asked for
  std::optional<std::int64_t> armed_;
  std::vector<std::uint32_t> restingListeners_;  // the process had no descriptor for a connection
};

Status SocketIngress::start() {
  const std::pair<int, PollTag> own[] = {{wake_.get(), {Kind::Wake}},
                                         {signals_.descriptor(), {Kind::Signal}},
                                         {deadline_.get(), {Kind::Deadline}},
                                         {clockStep_.get(), {Kind::ClockStep}}};
  for (const auto& [descriptor, tag] : own) {
    if (!poll_.add(descriptor, tag)) return systemError("cannot wait for", "signals and timers");
  }
  for (std::uint32_t i = 0; i < sockets_.sockets.size(); ++i) {
    const ListeningSocket& socket = sockets_.sockets[i];
    if (socket.kind != RecorderSocket::Kind::Datagrams) {
      if (!watch(i)) return systemError("cannot wait for", "a socket");
      continue;
    }
    if (!datagrams_.add(socket)) return systemError("cannot wait for", "a socket");
  }
  return Done{};
}

bool SocketIngress::watch(std::uint32_t listener) {
  const ListeningSocket& socket = sockets_.sockets[listener];
  const bool isControl = socket.kind == RecorderSocket::Kind::Control;
  return poll_.add(socket.descriptor.get(),
                   {isControl ? Kind::ControlListener : Kind::StreamListener, listener});
}

Status SocketIngress::run(IngressHandler& handler) {
  Events events{};
  int count = 0;
  for (;;) {
    now_ = bootNanoseconds();
    handler.beginRound(now_, wallSeconds());
    if (!stoppedReading_) {
      if (auto served = serve(events, count, handler); !served) return served;
    }
    const auto delay = handler.endRound();
    if (stopped_.exchange(false)) {
      takeCount(wake_.get());
      return Done{};
    }
    if (auto set = setDeadline(delay); !set) return set;
    const auto arrived = stoppedReading_ ? waitForWake() : wait(events);
    if (!arrived) return arrived.error();
    count = *arrived;
  }
}

Status SocketIngress::serve(const Events& events, int count, IngressHandler& handler) {
  if (auto served = serveDatagrams(events, count, handler); !served) return served;
  if (auto served = serveConnections(events, count, handler); !served) return served;
  serveListeners(events, count, handler);
  return std::exchange(signalled_, false) ? serveSignals(handler) : Status(Done{});
}

// Nanoseconds until something is to be done although nothing arrives; empty: never.
std::optional<std::int64_t> SocketIngress::waitingTime() const {
  constexpr std::int64_t kNever = std::numeric_limits<std::int64_t>::max();
  std::int64_t first = std::min(control_.deadline().value_or(kNever),  //
                                datagrams_.due().value_or(kNever));
  if (streams_.hasWaiting() || !restingListeners_.empty()) {
    first = std::min(first, resumed_ + kWaitingTime);
  }
  if (first == kNever) return std::nullopt;
  return std::max<std::int64_t>(first - bootNanoseconds(), 0);
}

Result<int> SocketIngress::wait(Events& events) {
  for (;;) {
    const auto time = waitingTime();
    const bool returnsMemory = datagrams_.holdsMemory() && (!time || *time > kQuietTime);
    const int count =
        poll_.wait(events.data(), kMostEvents, returnsMemory ? std::optional(kQuietTime) : time);
    if (count < 0 && errno != EINTR) return systemError("cannot wait for", "the sockets");
    if (count == 0 && returnsMemory) {
      datagrams_.releaseMemory();
    } else if (count >= 0) {
      return count;
    }
  }
}

Result<int> SocketIngress::waitForWake() {
  pollfd wake{wake_.get(), POLLIN, 0};
  if (retried([&] { return ::poll(&wake, 1, -1); }) < 0) {
    return systemError("cannot wait for", "a commit");
  }
  takeCount(wake_.get());
  return 0;
}

Status SocketIngress::serveDatagrams(const Events& events, int count, IngressHandler& handler) {
  for (int i = 0; i < count; ++i) {
    const PollTag tag = PollTag::of(events[static_cast<std::size_t>(i)]);
    if (tag.kind != Kind::Datagrams) continue;
    if (auto served = datagrams_.serve(tag.index, now_, handler); !served) return served;
  }
  return datagrams_.servePaused(now_, handler);
}

// Datagrams are asked for again while much comes in streams: their queue is short.
Status SocketIngress::serveConnections(const Events& events, int count, IngressHandler& handler) {
  constexpr std::size_t kMuch = 64u << 10;
  std::size_t bytes = 0;
  for (int i = 0; i < count; ++i) {
    const epoll_event& event = events[static_cast<std::size_t>(i)];
    const PollTag tag = PollTag::of(event);
    if (tag.kind == Kind::Stream) bytes += streams_.read(tag.index, handler);
    if (tag.kind == Kind::Control) control_.serve(tag.index, event.events, handler);
    if (tag.kind == Kind::Signal) signalled_ = true;
    if (tag.kind == Kind::Wake) takeCount(wake_.get());
    if (tag.kind == Kind::ClockStep) takeCount(clockStep_.get());
    if (tag.kind == Kind::Deadline) {
      takeCount(deadline_.get());
      armed_.reset();
      resumed_ = 0;
    }
    if (bytes < kMuch) continue;
    bytes = 0;
    if (auto drained = datagrams_.serveAll(handler); !drained) return drained;
  }
  control_.closeLate(now_);
  // If it has not come to all, the next round follows at once.
  if (now_ - resumed_ >= kWaitingTime && streams_.resume(handler)) resumed_ = now_;
  return Done{};
}

// Last: an index of a connection that was closed may be used again from here on.
void SocketIngress::serveListeners(const Events& events, int count, IngressHandler& handler) {
  for (int i = 0; i < count; ++i) {
    const PollTag tag = PollTag::of(events[static_cast<std::size_t>(i)]);
    if (tag.kind == Kind::StreamListener) accept(tag.index, false, handler);
    if (tag.kind == Kind::ControlListener) accept(tag.index, true, handler);
  }
  if (resumed_ != now_) return;
  for (const std::uint32_t listener : std::exchange(restingListeners_, {})) {
    if (!watch(listener)) restingListeners_.push_back(listener);
  }
}

void SocketIngress::accept(std::uint32_t listener, bool isControl, IngressHandler& handler) {
  constexpr int kMostAtOnce = 64;
  const int descriptor = sockets_.sockets[listener].descriptor.get();
  for (int i = 0; i < kMostAtOnce; ++i) {
    Descriptor socket(::accept4(descriptor, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    if (!socket) {
      if (errno == EAGAIN || errno == EINTR || errno == ECONNABORTED) return;
      // The process or the system is at a limit: clients wait in the queue.
      poll_.remove(descriptor);
      restingListeners_.push_back(listener);
      return;
    }
    if (isControl) {
      control_.add(std::move(socket), now_);
    } else {
      streams_.add(std::move(socket), handler);
    }
  }
}

Status SocketIngress::serveSignals(IngressHandler& handler) {
  while (const int signal = signals_.take()) {
    if (signal == SIGHUP) {
      handler.onReload();
      continue;
    }
    // What has been sent to the program by now is not lost with it.
    if (auto taken = takeEverything(handler); !taken) return taken;
    handler.onTerminate();
  }
  return Done{};
}

Status SocketIngress::takeEverything(IngressHandler& handler) {
  constexpr int kPasses = 4;  // what the buffer of a stream socket commonly holds
  for (int pass = 0; pass < kPasses; ++pass) {
    if (auto drained = datagrams_.serveAll(handler); !drained) return drained;
    streams_.readAll(handler);
  }
  return Done{};
}

Status SocketIngress::setDeadline(std::optional<std::int64_t> delay) {
  if (delay && *delay <= 0) {
    wake();
    return Done{};
  }
  std::optional<std::int64_t> next;
  if (delay) next = now_ + *delay;
  if (!next && !armed_) return Done{};
  if (next && armed_ && std::abs(*next - *armed_) < kMillisecond) return Done{};
  // The end of the year 9999. It is read when somebody sets the clock.
  constexpr std::int64_t kNever = 253402300799;
  if (auto set = setTimer(clockStep_.get(), TFD_TIMER_ABSTIME | TFD_TIMER_CANCEL_ON_SET,
                          next ? kNever : 0, 0);
      !set) {
    return set;
  }
  armed_ = next;
  constexpr std::int64_t kSecond = 1'000'000'000;
  return setTimer(deadline_.get(), TFD_TIMER_ABSTIME, next.value_or(0) / kSecond,
                  next.value_or(0) % kSecond);
}

}  // namespace

Result<std::unique_ptr<Ingress>> openIngress(const DeviceRoot& root, const IngressOptions& options,
                                             SystemLog& log) {
  auto activated = takeActivatedSockets();
  if (!activated) return activated.error();
  std::optional<ListeningSockets> sockets = *std::move(activated);
  if (sockets && !options.udpAddresses.empty()) {
    log.message(LogLevel::Info,
                "the sockets are systemd's; its socket unit says which UDP "
                "addresses are served");
  }
  if (!sockets) {
    auto opened = openSockets(root, options.udpAddresses);
    if (!opened) return opened.error();
    sockets.emplace(*std::move(opened));
  }
  auto created = PollSet::create();
  if (!created) return created.error();
  auto poll = std::make_unique<PollSet>(*std::move(created));
  auto datagrams = DatagramReceiver::create(*poll);
  if (!datagrams) return datagrams.error();
  auto ingress = std::make_unique<SocketIngress>(*std::move(sockets), std::move(poll),
                                                 *std::move(datagrams), log);
  if (auto started = ingress->start(); !started) return started.error();
  return std::unique_ptr<Ingress>(std::move(ingress));
}

}  // namespace tally
