// The main event loop.
#pragma once

namespace tally {

enum class SliceResult { Finished, Stopped, TimedOut, HandledEvent };

class EventLoop {
 public:
  virtual ~EventLoop() = default;
  // Runs the main thread's event sources until one event was handled (when returnAfterOneEvent) or
  // the seconds have passed. Finished means that there is no source that could ever deliver.
  virtual SliceResult runMainLoopSlice(double seconds, bool returnAfterOneEvent) = 0;
};

}  // namespace tally
