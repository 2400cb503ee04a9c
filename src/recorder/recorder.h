// The recorder: takes the metrics of other programs in, and decides when they are committed.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/recording/ingress.h"
#include "platform/recording/recording_store.h"
#include "platform/system_log.h"
#include "recorder/committer.h"
#include "recorder/metric_intake.h"
#include "recorder/recorder_status.h"
#include "recorder/recording_clock.h"

namespace tally {

// What the recorder is given; all that is referred to outlives it.
struct RecorderParts {
  RecordingStore& store;
  Ingress& ingress;
  SystemLog& log;
  std::string bootId;
  std::function<RecorderSettings()> readSettings;
  std::function<bool()> clockIsSynchronised;
  std::function<void()> onCommitted;  // called after each commit
};

class Recorder final : public IngressHandler {
 public:
  explicit Recorder(RecorderParts parts);

  void beginRound(std::int64_t bootNanoseconds, double secondsSince1970) override;
  void onLines(Sender sender, std::string_view lines) override;
  void onLoss(IngressLoss loss, Sender sender, std::uint64_t count) override;
  std::size_t streamQuota(Sender sender) override;
  void onControl(ControlRequest request, std::string_view line) override;
  void onTerminate() override { terminating_ = true; }
  void onReload() override;
  std::optional<std::int64_t> endRound() override;

  bool isCommitting() const { return committer_.isBusy(); }
  // Whether something was recorded that is not in the store.
  bool hasUncommitted() const { return intake_.heldSince() || intake_.hasWaiting(); }

 private:
  struct Control {
    enum class State { Received, Due, Waiting };
    ControlRequest request;
    State state;
    std::uint64_t afterCommit = 0;  // answered when so many commits have ended
    bool forgets = false;           // else it commits
  };

  void beginDay();
  std::int64_t interval() const;  // nanoseconds
  bool commitIsDue() const;
  bool durableIsDue() const;
  bool allIsDue() const;
  // False when there was nothing to commit.
  bool startCommit();
  // One last commit before the recorder ends, of the time that it ran; false when there was none.
  bool commitRunning();
  // Whether a commit has ended, and well.
  bool endCommit();
  void takeUpControls();
  void answerControls();
  bool mayEnd() const;
  void end();
  std::optional<std::int64_t> nextRound() const;

  RecorderParts parts_;
  MetricIntake intake_;
  RecordingClock clock_;
  Committer committer_;
  RecordingMoment now_;
  double secondsSince1970_ = 0;
  std::vector<Control> controls_;
  std::int64_t retryAt_ = 0;  // after a commit that failed
  bool dateUndated_ = true, terminating_ = false, finalCommitBegan_ = false;
  // Until when, since boot, the time that it ran is in the store or was not wanted.
  std::int64_t ranCountedUntil_ = 0, runningCommittedAt_ = -1;
  bool countsRunning_ = false;
  bool askedToCommit_ = false, askedToForget_ = false;
  CommitFigures commits_;
};

}  // namespace tally
