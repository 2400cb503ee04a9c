// The recorder: takes the metrics of other programs in, keeps them in memory and commits them.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/recording/ingress.h"
#include "platform/recording/recording_store.h"
#include "platform/system_log.h"
#include "recorder/commit_batch.h"
#include "recorder/committer.h"
#include "recorder/held_keys.h"
#include "recorder/key_rules.h"
#include "recorder/recording_clock.h"
#include "recorder/recording_users.h"
#include "recorder/statsd_line.h"

namespace tally {

// What the recorder is given; all of it outlives the recorder.
struct RecorderParts {
  RecordingStore& store;
  Ingress& ingress;
  SystemLog& log;
  std::string bootId;
  std::function<RecorderSettings()> readSettings;
  std::function<bool()> clockIsSynchronised;
  std::function<void()> afterCommit;  // called by another thread
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

 private:
  // A metric whose line was read.
  void record(std::uint32_t user, const MetricLine& metric);
  std::uint32_t keyFor(std::uint32_t user, const MetricLine& metric);
  std::uint32_t addKey(std::uint32_t user, const MetricLine& metric, std::string_view identity);
  void addValues(HeldKey& key, std::uint32_t user, const MetricLine& metric);
  void addSample(HeldKey& key, std::uint32_t user, double value, double rate);
  void noteType(HeldKey& key, MetricType type);
  void refuse(std::uint32_t user, Refusal refusal, std::uint64_t count = 1);
  void count(RecorderCount which, std::uint64_t amount = 1);
  void growSamples(std::uint32_t user, std::size_t bytes);
  std::size_t bytes() const { return keyBytes_ + sampleBytes_; }
  std::size_t memoryForData() const;

  void beginDay();
  void loadOwners();
  // Moves what is held, or of durable keys alone, out of the keys of the day.
  CommitBatch takeBatch(bool durableAlone, bool atEnd);
  void takeChange(CommitBatch& batch, HeldKey& key, bool atEnd);
  void takeCounts(CommitBatch& batch);
  void endCommit();
  void returnMemory(const CommitBatch& batch);
  bool commitIsDue() const;
  void startCommit(bool durableAlone);
  void answerControls();
  // Thins samples until memory is within its limit, or nothing more can be thinned.
  void thin();
  // One layer of the user's samples, the oldest that has any; false when nothing is left to thin.
  bool thinOldest(std::uint32_t user);
  std::uint64_t thinned(SampleStream& samples, std::uint32_t user);
  bool mayEnd() const;
  std::optional<std::int64_t> nextRound() const;
  std::string statusText() const;

  struct Control {
    enum class State { Received, Due, Waiting };
    ControlRequest request;
    State state;
    std::uint64_t afterCommit;  // answered when so many commits have ended
  };

  RecorderParts parts_;
  KeyRules rules_;
  RecordingClock clock_;
  RecordingUsers users_;
  Committer committer_;
  std::shared_ptr<HeldKeys> keys_;
  std::deque<CommitBatch> ended_;  // of former days and of commits that failed, oldest first
  std::vector<MetricValue> values_;
  std::string identity_;

  RecordingMoment now_;
  std::int64_t bootNanoseconds_ = 0, startedAt_ = 0, lastLineAt_ = 0;
  double secondsSince1970_ = 0;
  std::optional<std::int64_t> heldSince_;  // since when something waits to be committed
  std::int64_t retryAt_ = 0;               // after a commit that failed
  std::optional<double> commitFailedSince_;
  bool durableWaits_ = false, dateUndated_ = true, terminating_ = false, askedToCommit_ = false;
  std::vector<Control> controls_;
  std::uint64_t commitsStarted_ = 0, commitsEnded_ = 0, commitsFailed_ = 0;
  std::string lastFailure_;
  std::optional<double> lastCommitAt_;

  std::size_t keyBytes_ = 0, sampleBytes_ = 0;  // samples that are being committed included
  std::uint64_t samplesHeld_ = 0, metrics_ = 0;
  // Since the start, and what of it has been put into batches.
  RefusalCounts refused_{}, refusedTaken_{};
  std::array<std::uint64_t, kRecorderCountCount> counts_{}, countsTaken_{};
};

}  // namespace tally
