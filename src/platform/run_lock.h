// Turns: two runs on one device never work at once.
#pragma once

namespace tally {

class RunLock {
 public:
  virtual ~RunLock() = default;
  // Waits until no other run is working. Nested calls are allowed.
  virtual void enter() = 0;
  virtual void leave() = 0;
};

// Holds a turn for a scope.
class RunTurn {
 public:
  explicit RunTurn(RunLock& lock) : lock_(lock) { lock_.enter(); }
  ~RunTurn() { lock_.leave(); }
  RunTurn(const RunTurn&) = delete;
  RunTurn& operator=(const RunTurn&) = delete;

 private:
  RunLock& lock_;
};

}  // namespace tally
