#include "recorder/committer.h"

#include <algorithm>
#include <limits>
#include <utility>
#include <vector>

#include "base/time_text.h"

namespace tally {
namespace {

// Of samples that are unpacked at a time: a row of the store.
constexpr std::size_t kSamplesAtATime = 4096;
constexpr std::size_t kUndatedAtATime = 256;
constexpr std::uint64_t kMostCounted = std::numeric_limits<std::int64_t>::max();

// Applies a change whose samples' offsets count from an instant: each sample on its own day, a
// scalar on that of the instant.
Status applyFrom(RecordingTransaction& transaction, double instant, RecordedChange change) {
  const std::int32_t firstDay = dayOfSeconds(instant);
  if (change.kind != RecordedChange::Kind::Samples) return transaction.apply(firstDay, change);
  const double intoDay = instant - static_cast<double>(firstDay) * kSecondsPerDay;
  const auto shift = static_cast<std::int64_t>(intoDay);
  const SampleColumns all = change.samples;
  std::vector<std::uint32_t> offsets;
  for (std::size_t i = 0; i < all.values.size();) {
    const std::int64_t days = (shift + all.offsets[i]) / kSecondsPerDay;
    offsets.clear();
    std::size_t end = i;
    for (; end < all.values.size(); ++end) {
      const std::int64_t second = shift + all.offsets[end] - days * kSecondsPerDay;
      if (second < 0 || second >= kSecondsPerDay) break;
      offsets.push_back(static_cast<std::uint32_t>(second));
    }
    const std::size_t count = end - i;
    change.samples = {all.values.subspan(i, count), offsets,
                      all.weights.empty() ? all.weights : all.weights.subspan(i, count)};
    auto applied = transaction.apply(firstDay + static_cast<std::int32_t>(days), change);
    if (!applied) return applied;
    i = end;
  }
  return Done{};
}

class BatchWriter {
 public:
  BatchWriter(RecordingTransaction& transaction, const std::string& bootId,
              const CommitBatch& batch)
      : transaction_(transaction), bootId_(bootId), batch_(batch) {}

  Status write() {
    for (const CommitBatch::Change& change : batch_.changes) {
      auto written = write(change);
      if (!written) return written;
    }
    for (std::size_t i = 0; i < kRefusalCount; ++i) {
      if (auto added = add(kRefusals[i].key, batch_.refused[i]); !added) return added;
    }
    for (std::size_t i = 0; i < kRecorderCountCount; ++i) {
      if (auto added = add(kRecorderCounts[i].key, batch_.counts[i]); !added) return added;
    }
    const auto day = ownersDay();
    for (std::size_t i = 0; day && i < batch_.owners.size(); ++i) {
      if (auto set = transaction_.setOwner(*day, batch_.owners[i]); !set) return set;
    }
    return Done{};
  }

 private:
  std::optional<std::int32_t> ownersDay() const {
    if (batch_.day) return batch_.day;
    if (batch_.originOnClock) return dayOfSeconds(*batch_.originOnClock);
    return std::nullopt;
  }

  Status apply(const RecordedChange& change) {
    if (batch_.day) return transaction_.apply(*batch_.day, change);
    if (batch_.originOnClock) return applyFrom(transaction_, *batch_.originOnClock, change);
    return transaction_.addUndated(bootId_, batch_.origin, change);
  }

  Status add(std::string_view key, std::uint64_t count) {
    if (count == 0) return Done{};
    RecordedChange change;
    change.key = key;
    change.value = static_cast<std::int64_t>(std::min(count, kMostCounted));
    return apply(change);
  }

  Status write(const CommitBatch::Change& change) {
    RecordedChange recorded{.kind = change.kind,
                            .key = change.key,
                            .value = change.value,
                            .samples = {},
                            .user = change.userNumber};
    if (change.kind != RecordedChange::Kind::Samples) return apply(recorded);
    SampleStream::Reader reader(*change.samples);
    while (reader.next(samples_, kSamplesAtATime)) {
      recorded.samples = samples_.columns();
      if (auto applied = apply(recorded); !applied) return applied;
    }
    return Done{};
  }

  RecordingTransaction& transaction_;
  const std::string& bootId_;
  const CommitBatch& batch_;
  StreamSamples samples_;
};

Status dateUndated(RecordingTransaction& transaction, const std::string& bootId,
                   double wallMinusBoot) {
  for (;;) {
    const auto taken = transaction.takeUndated(bootId, kUndatedAtATime);
    if (!taken) return taken.error();
    for (const UndatedChange& undated : *taken) {
      const RecordedChange change{.kind = undated.kind,
                                  .key = undated.key,
                                  .value = undated.value,
                                  .samples = {undated.values, undated.offsets, undated.weights},
                                  .user = undated.user};
      const double instant = wallMinusBoot + static_cast<double>(undated.secondsSinceBoot);
      if (auto applied = applyFrom(transaction, instant, change); !applied) return applied;
      const KeyOwner owner{undated.key, undated.user,
                           undated.kind == RecordedChange::Kind::Samples};
      if (auto set = transaction.setOwner(dayOfSeconds(instant), owner); !set) return set;
    }
    if (taken->size() < kUndatedAtATime) return Done{};
  }
}

}  // namespace

Committer::~Committer() {
  if (thread_.joinable()) thread_.join();
}

void Committer::start(CommitJob job) {
  outcome_ = {};
  outcome_.job = std::move(job);
  ended_ = false;
  thread_ = std::thread([this] {
    {
      const std::lock_guard guard(storeInUse_);
      outcome_.status = write(outcome_.job, outcome_.undatedForgotten);
      store_.releaseMemory();
    }
    ended_ = true;
    onDone_();
  });
}

std::optional<Committer::Outcome> Committer::takeOutcome() {
  if (!thread_.joinable() || !ended_) return std::nullopt;
  thread_.join();
  return std::move(outcome_);
}

Status Committer::write(CommitJob& job, std::uint64_t& undatedForgotten) {
  auto transaction = store_.begin();
  if (!transaction) return transaction.error();
  if (job.wallMinusBoot) {
    auto dated = dateUndated(**transaction, bootId_, *job.wallMinusBoot);
    if (!dated) return dated;
  }
  bool hasUndated = false;
  for (const CommitBatch& batch : job.batches) {
    if (auto written = BatchWriter(**transaction, bootId_, batch).write(); !written) return written;
    hasUndated = hasUndated || (!batch.day && !batch.originOnClock);
  }
  if (job.wallMinusBoot || hasUndated) {
    const auto forgotten =
        (*transaction)->forgetUndated(job.wallMinusBoot ? std::optional(job.today) : std::nullopt);
    if (!forgotten) return forgotten.error();
    undatedForgotten = *forgotten;
  }
  return (*transaction)->commit();
}

}  // namespace tally
