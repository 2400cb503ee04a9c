// Writes to the store while the recorder goes on receiving.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "base/result.h"
#include "platform/recording/recording_store.h"
#include "recorder/commit_batch.h"

namespace tally {

// A thread for each commit, since most of the time there is none. A store may be locked for a
// minute, and a flash may take seconds.
class Committer {
 public:
  struct Outcome {
    Status status = Done{};
    CommitJob job;  // as it was given, also when it failed
    std::uint64_t undatedForgotten = 0;
    bool countsRunning = false;  // the time that the recorder ran is wanted, and was committed
    // Keys that turned out to be others' on a day; what was recorded of them is refused.
    struct Foreign {
      std::int32_t day;
      KeyOwner owner;
    };
    std::vector<Foreign> foreign;
    std::uint64_t refused = 0;
  };
  // onDone is called by the thread when there is an outcome.
  Committer(RecordingStore& store, std::string bootId, std::function<void()> onDone)
      : store_(store), bootId_(std::move(bootId)), onDone_(std::move(onDone)) {}
  ~Committer();
  Committer(const Committer&) = delete;
  Committer& operator=(const Committer&) = delete;

  bool isBusy() const { return busy_; }
  // REQUIRES: it is not busy.
  void start(CommitJob job);
  // The outcome of the commit that has ended, once.
  std::optional<Outcome> takeOutcome();
  // Calls it with the store, after the commit in hand.
  template <class Work>
  auto withStore(const Work& work) {
    const std::lock_guard guard(storeInUse_);
    return work(store_);
  }

 private:
  Status write(Outcome& outcome);

  RecordingStore& store_;
  const std::string bootId_;
  std::function<void()> onDone_;
  std::mutex storeInUse_;
  std::thread thread_;
  bool busy_ = false;
  std::atomic<bool> ended_ = false;
  Outcome outcome_;
};

}  // namespace tally
