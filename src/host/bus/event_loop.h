// The main event loop over sd-event.
#pragma once

#include <memory>

#include "platform/event_loop.h"
#include "platform/system_log.h"

struct sd_event;

namespace tally {

// The loop is made at its first use. From then on SIGTERM and SIGINT end the waiting instead of the
// process: the slice that gets one returns Stopped and every later slice returns TimedOut at once,
// so that a caller that waits for quiet ends as if it had become quiet, finishing work in progress.
// A slice without anything to wait for waits its time out all the same and is TimedOut. Work of a
// source is an event only if the source says so.
class SdEventLoop final : public EventLoop {
 public:
  explicit SdEventLoop(std::shared_ptr<SystemLog> log) : log_(std::move(log)) {}
  ~SdEventLoop() override;
  SdEventLoop(const SdEventLoop&) = delete;
  SdEventLoop& operator=(const SdEventLoop&) = delete;

  SliceResult runMainLoopSlice(double seconds, bool returnAfterOneEvent) override;
  // For services that deliver their events here; borrowed, null when there can be no loop.
  sd_event* event();
  // Such a service has handled an event. Its other work (replies of the bus, messages that it
  // refuses) does not extend a quiet period.
  void noteHandledEvent() { handled_ = true; }

 private:
  std::shared_ptr<SystemLog> log_;
  sd_event* event_ = nullptr;
  bool tried_ = false;
  bool stopRequested_ = false;
  bool handled_ = false;  // in this slice
};

}  // namespace tally
