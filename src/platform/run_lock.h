// The run lock: serialises the runs on one device.
#pragma once

namespace tally {

class RunLock {
 public:
  virtual ~RunLock() = default;
  // Waits until no other run is working, for a bounded time. False, after one line that names the
  // other run's process, if it is still working; the caller must then do nothing. Nested calls are
  // allowed; each one that succeeds is followed by a leave().
  virtual bool enter() = 0;
  virtual void leave() = 0;
};

// Holds the lock for a scope.
class RunTurn {
 public:
  explicit RunTurn(RunLock& lock) : lock_(lock), held_(lock.enter()) {}
  ~RunTurn() {
    if (held_) lock_.leave();
  }
  explicit operator bool() const { return held_; }
  RunTurn(const RunTurn&) = delete;
  RunTurn& operator=(const RunTurn&) = delete;

 private:
  RunLock& lock_;
  bool held_;
};

}  // namespace tally
