// Takes metrics into memory: names, owners and limits are checked here, and memory is kept within
// its limit.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/recording/ingress.h"
#include "platform/system_log.h"
#include "recorder/commit_batch.h"
#include "recorder/held_keys.h"
#include "recorder/key_rules.h"
#include "recorder/recording_clock.h"
#include "recorder/recording_users.h"
#include "recorder/refused_names.h"
#include "recorder/statsd_line.h"

namespace tally {

class MetricIntake {
 public:
  // Borrows the log.
  MetricIntake(RecorderSettings settings, SystemLog& log)
      : rules_(std::move(settings)), log_(log) {}

  // From now on; keys whose owners may not record them any longer are free for those who may.
  // REQUIRES: a day has begun.
  void setSettings(RecorderSettings settings);
  const RecorderSettings& settings() const { return rules_.settings(); }

  // The moment of what is recorded from now on. REQUIRES: beginDay() when its day is another one.
  void setNow(const RecordingMoment& moment) { now_ = moment; }
  // Ends the day in progress, whose batch waits from now on, and begins that of the moment, in
  // which keys have these owners.
  void beginDay(const RecordingMoment& moment, std::span<const KeyOwner> owners);
  // Null before the first day.
  const HeldKeys* keys() const { return keys_.get(); }

  void recordLines(Sender sender, std::string_view lines);
  void refuse(Sender sender, Refusal refusal, std::uint64_t count);
  void count(RecorderCount which, std::uint64_t amount = 1);
  // Bytes of lines that the user may send now without being refused some; 0: none.
  std::size_t allowedBytes(Sender sender);

  // Since when, in nanoseconds since boot, something waits to be taken; empty if nothing does.
  std::optional<std::int64_t> heldSince() const { return heldSince_; }
  // When keys that are durable are to be committed, on the same clock; empty if none has changed.
  std::optional<std::int64_t> durableDue() const { return durableDue_; }
  bool hasWaiting() const { return !waiting_.empty(); }
  std::int64_t lastLineAt() const { return lastLineAt_; }

  enum class Take { Durable, All, AllAtEnd };
  // Moves what waits out: former days, then the day in progress, of which
  // Durable takes those keys alone. At the end nothing is kept for later, fractions neither.
  std::vector<CommitBatch> take(Take which);
  // Takes batches back whose commit failed: what is of the day in progress becomes a part of it
  // again, so that a store that fails for long takes no more memory than one that does not.
  void putBack(std::vector<CommitBatch> batches);
  // Keys that are others', as the store knows them: so many changes of theirs were refused there.
  void yieldKeys(std::span<const KeyOwner> owners, std::uint64_t changes);
  // The batch is in the store.
  void forget(const CommitBatch& batch);
  // Drops everything that waits to be committed.
  void discard();
  // Thins samples until memory is within its limit, or nothing more can be thinned.
  void thin();

  // What keys and samples take, those being committed included, and what they may take.
  std::size_t bytes() const;
  std::size_t mostBytes() const;
  // Whether so much is held that it had better be committed before it has to be thinned.
  bool isHalfFull() const { return sampleBytes_ >= (mostBytes() - keys_->bytes()) / 2; }
  std::size_t sampleBytes() const { return sampleBytes_; }
  std::uint64_t samples() const { return samples_; }
  std::uint64_t metrics() const { return metrics_; }
  const RecordingUsers& users() const { return users_; }
  const RefusalCounts& refused() const { return refused_; }
  const RefusedNames& refusedNames() const { return refusedNames_; }
  // The key of one of them.
  std::string keyOf(const RefusedNames::Row& row) const;
  const RecorderCounts& counts() const { return counts_; }

 private:
  void record(std::uint32_t user, const MetricLine& metric);
  std::uint32_t keyFor(std::uint32_t user, const MetricLine& metric);
  std::uint32_t addKey(std::uint32_t user, const MetricLine& metric, std::string_view identity);
  void addOwned(const KeyOwner& owner);
  void applyRules(HeldKey& key);
  void addValues(HeldKey& key, std::uint32_t user, const MetricLine& metric);
  void addSample(HeldKey& key, std::uint32_t user, double value, double rate);
  void noteType(HeldKey& key, LineType type);
  void refuseFor(std::uint32_t user, Refusal refusal, std::uint64_t count);
  // The same of the line in hand, whose metric is remembered.
  void refuseLine(std::uint32_t user, Refusal refusal, const MetricLine& metric,
                  std::string_view identity);
  void refuseKey(std::uint32_t user, Refusal refusal, const HeldKey& key, std::uint64_t count);
  void growSamples(std::uint32_t user, std::size_t bytes);
  void markHeld();
  void markDurable(std::uint32_t user);

  CommitBatch takeBatch(Take which);
  void takeChange(CommitBatch& batch, std::uint32_t index, bool atEnd);
  void takeCounts(CommitBatch& batch);
  void putBackHeld(CommitBatch& batch);
  void dateWaiting();
  // One layer of the user's samples, the oldest that has any; false when nothing is left to thin.
  bool thinOldest(std::uint32_t user);
  std::uint64_t thinned(SampleStream& samples, std::uint32_t user);
  void dropOldest();

  KeyRules rules_;
  SystemLog& log_;
  RecordingUsers users_;
  RecordingMoment now_;
  std::shared_ptr<HeldKeys> keys_;
  std::deque<CommitBatch> waiting_;  // of former days, oldest first
  std::vector<MetricValue> values_;  // of the line in hand
  std::string identity_;

  std::optional<std::int64_t> heldSince_;
  std::int64_t lastLineAt_ = 0;
  std::optional<std::int64_t> durableDue_;
  std::size_t sampleBytes_ = 0;
  std::uint64_t samples_ = 0, metrics_ = 0;
  // Since the start, and what of it has been put into batches.
  RefusalCounts refused_{}, refusedTaken_{};
  RefusedNames refusedNames_;
  RecorderCounts counts_{}, countsTaken_{};
};

}  // namespace tally
