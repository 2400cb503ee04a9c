#include "host/bus/event_loop.h"

#include <signal.h>
#include <systemd/sd-event.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstring>
#include <thread>

#include "base/time_text.h"

namespace tally {
namespace {

using SteadyClock = std::chrono::steady_clock;

constexpr double kLongestSlice = 365.0 * kSecondsPerDay;

int requestStop(sd_event_source*, const signalfd_siginfo*, void* stopRequested) {
  *static_cast<bool*>(stopRequested) = true;
  return 0;
}

}  // namespace

SdEventLoop::~SdEventLoop() { ::sd_event_unref(event_); }

sd_event* SdEventLoop::event() {
  if (tried_) return event_;
  tried_ = true;
  int result = ::sd_event_new(&event_);
  // sd-event takes signals from a descriptor, for which they have to be blocked.
  for (const int number : {SIGTERM, SIGINT}) {
    if (result < 0) break;
    sigset_t set;
    ::sigemptyset(&set);
    ::sigaddset(&set, number);
    ::sigprocmask(SIG_BLOCK, &set, nullptr);
    result = ::sd_event_add_signal(event_, nullptr, number, requestStop, &stopRequested_);
  }
  if (result < 0) {
    log_->fault("event loop", "event loop: cannot be created: {}", std::strerror(-result));
    event_ = ::sd_event_unref(event_);
  }
  return event_;
}

SliceResult SdEventLoop::runMainLoopSlice(double seconds, bool returnAfterOneEvent) {
  sd_event* const loop = event();
  if (stopRequested_) return SliceResult::TimedOut;
  const double bounded = std::isnan(seconds) ? 0 : std::clamp(seconds, 0.0, kLongestSlice);
  const auto end = SteadyClock::now() + std::chrono::duration_cast<SteadyClock::duration>(
                                            std::chrono::duration<double>(bounded));
  handled_ = false;
  while (loop != nullptr) {
    const auto left = std::chrono::duration_cast<std::chrono::microseconds>(
        std::max(end - SteadyClock::now(), SteadyClock::duration::zero()));
    const int result = ::sd_event_run(loop, static_cast<std::uint64_t>(left.count()));
    if (stopRequested_) return SliceResult::Stopped;
    if (result < 0) {
      log_->fault("event loop", "event loop: {}", std::strerror(-result));
      break;
    }
    if (handled_ && returnAfterOneEvent) return SliceResult::HandledEvent;
    if (SteadyClock::now() >= end) {
      return handled_ ? SliceResult::HandledEvent : SliceResult::TimedOut;
    }
  }
  // Without a loop the time still passes, so that a caller never spins.
  std::this_thread::sleep_until(end);
  return SliceResult::TimedOut;
}

}  // namespace tally
