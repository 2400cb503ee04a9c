#include "recorder/committer.h"

#include <algorithm>
#include <new>
#include <set>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include "base/time_text.h"
#include "platform/clock.h"

namespace tally {
namespace {

// Of samples that are unpacked at a time: a row of the store.
constexpr std::size_t kSamplesAtATime = 4096;
constexpr std::size_t kUndatedAtATime = 256;
constexpr std::string_view kOwnCounts = "vellum.tallyd.";

// Applies a change whose samples' offsets count from an instant: each sample on its own day, a
// scalar on that of the instant. Samples of later days than `today` are dropped: the clock was
// wrong.
Status applyFrom(RecordingTransaction& transaction, double instant, std::int32_t today,
                 RecordedChange change) {
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
    if (firstDay + days <= today) {
      auto applied = transaction.apply(firstDay + static_cast<std::int32_t>(days), change);
      if (!applied) return applied;
    }
    i = end;
  }
  return Done{};
}

// Says whose keys are, and remembers which turned out to be others'.
class OwnerCheck {
 public:
  OwnerCheck(RecordingTransaction& transaction, Committer::Outcome& outcome)
      : transaction_(transaction), outcome_(outcome) {}

  // Whether the user may record the key on that day; it is then the user's. A key that is not is
  // counted.
  Result<bool> claim(std::int32_t day, const KeyOwner& wanted) {
    const auto owner = transaction_.owner(day, wanted.key);
    if (!owner) return owner.error();
    if (!*owner) {
      if (auto set = transaction_.setOwner(day, wanted); !set) return set.error();
      return true;
    }
    if (**owner == wanted.user) return true;
    ++outcome_.refused;
    outcome_.foreign.push_back({day, {wanted.key, **owner, wanted.distribution}});
    return false;
  }

 private:
  RecordingTransaction& transaction_;
  Committer::Outcome& outcome_;
};

class BatchWriter {
 public:
  BatchWriter(RecordingTransaction& transaction, const std::string& bootId, const CommitJob& job,
              const CommitBatch& batch, Committer::Outcome& outcome)
      : transaction_(transaction),
        bootId_(bootId),
        today_(job.today),
        batch_(batch),
        owners_(transaction, outcome) {}

  Status write() {
    const auto day = batch_.day             ? batch_.day
                     : batch_.originOnClock ? std::optional(dayOfSeconds(*batch_.originOnClock))
                                            : std::nullopt;
    if (day) {
      if (auto claimed = claim(*day); !claimed) return claimed;
    }
    for (const CommitBatch::Change& change : batch_.changes) {
      if (foreign_.contains(change.key)) continue;
      auto written = write(change);
      if (!written) return written;
    }
    for (std::size_t i = 0; i < kRefusalCount; ++i) {
      if (auto added = add(kRefusals[i].key, batch_.refused[i]); !added) return added;
    }
    for (std::size_t i = 0; i < kRecorderCountCount; ++i) {
      if (auto added = add(kRecorderCounts[i].key, batch_.counts[i]); !added) return added;
    }
    return Done{};
  }

 private:
  // Keys that are new to this process may be others' all the same: the owners could not be read, or
  // the day was not known.
  Status claim(std::int32_t day) {
    for (const KeyOwner& owner : batch_.owners) {
      if (auto claimed = claim(day, owner); !claimed) return claimed;
    }
    if (batch_.day) return Done{};
    for (const CommitBatch::Change& change : batch_.changes) {
      const bool distribution = change.kind == RecordedChange::Kind::Samples;
      auto claimed = claim(day, {std::string(change.key), change.userNumber, distribution});
      if (!claimed) return claimed;
    }
    return Done{};
  }
  Status claim(std::int32_t day, const KeyOwner& owner) {
    if (foreign_.contains(owner.key)) return Done{};
    const auto claimed = owners_.claim(day, owner);
    if (!claimed) return claimed.error();
    if (!*claimed) foreign_.insert(owner.key);
    return Done{};
  }

  Status apply(const RecordedChange& change) {
    if (batch_.day) return transaction_.apply(*batch_.day, change);
    if (batch_.originOnClock) {
      return applyFrom(transaction_, *batch_.originOnClock, today_, change);
    }
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
  const std::int32_t today_;
  const CommitBatch& batch_;
  OwnerCheck owners_;
  std::set<std::string, std::less<>> foreign_;
  StreamSamples samples_;
};

Status dateUndated(RecordingTransaction& transaction, const std::string& bootId,
                   Committer::Outcome& outcome) {
  OwnerCheck owners(transaction, outcome);
  for (;;) {
    const auto taken = transaction.takeUndated(bootId, kUndatedAtATime);
    if (!taken) return taken.error();
    for (const UndatedChange& undated : *taken) {
      const double instant =
          *outcome.job.wallMinusBoot + static_cast<double>(undated.secondsSinceBoot);
      const std::int32_t day = dayOfSeconds(instant);
      if (day < kFirstPlausibleDay || day > outcome.job.today) {
        ++outcome.undatedForgotten;
        continue;
      }
      const RecordedChange change{.kind = undated.kind,
                                  .key = undated.key,
                                  .value = undated.value,
                                  .samples = {undated.values, undated.offsets, undated.weights},
                                  .user = undated.user};
      const bool isOwn = undated.key.starts_with(kOwnCounts);  // counted by the recorder itself
      const auto claimed = isOwn
                               ? Result<bool>(true)
                               : owners.claim(day, {undated.key, undated.user,
                                                    undated.kind == RecordedChange::Kind::Samples});
      if (!claimed) return claimed.error();
      if (!*claimed) continue;
      auto applied = applyFrom(transaction, instant, outcome.job.today, change);
      if (!applied) return applied;
    }
    if (taken->size() < kUndatedAtATime) return Done{};
  }
}

// To each day what fell on it; also nothing, which says that the recorder was there.
Status addRunning(RecordingTransaction& transaction, const CommitJob::Running& ran) {
  const auto second = [&](std::int64_t bootNanoseconds) {
    return static_cast<std::int64_t>(ran.wallMinusBoot +
                                     static_cast<double>(bootNanoseconds) / 1e9);
  };
  constexpr std::int64_t kDay = kSecondsPerDay;
  const std::int64_t end = second(ran.until);
  std::int64_t from = std::min(second(ran.from), end);
  do {
    const std::int64_t day = from / kDay;
    const std::int64_t until = std::min(end, (day + 1) * kDay);
    RecordedChange change;
    change.key = rowOf(OwnMetric::RecorderRan).key;
    change.value = until - from;
    if (auto added = transaction.apply(static_cast<std::int32_t>(day), change); !added) {
      return added;
    }
    from = until;
  } while (from < end);
  return Done{};
}

}  // namespace

Committer::~Committer() {
  if (thread_.joinable()) thread_.join();
}

void Committer::start(CommitJob job) {
  outcome_ = {};
  outcome_.job = std::move(job);
  ended_ = false;
  busy_ = true;
  const auto work = [this] {
    {
      const std::lock_guard guard(storeInUse_);
      try {
        outcome_.status = write(outcome_);
      } catch (const std::bad_alloc&) {
        outcome_.status = Error{"no memory for a commit"};
      }
      store_.releaseMemory();
    }
    ended_ = true;
    onDone_();
  };
  try {
    thread_ = std::thread(work);
  } catch (const std::system_error&) {
    work();  // the user has as many processes as it may: the sockets wait meanwhile
  }
}

std::optional<Committer::Outcome> Committer::takeOutcome() {
  if (!busy_ || !ended_) return std::nullopt;
  if (thread_.joinable()) thread_.join();
  busy_ = false;
  return std::move(outcome_);
}

Status Committer::write(Outcome& outcome) {
  const CommitJob& job = outcome.job;
  auto transaction = store_.begin();
  if (!transaction) return transaction.error();
  if (job.wallMinusBoot) {
    if (auto dated = dateUndated(**transaction, bootId_, outcome); !dated) return dated;
  }
  bool hasUndated = false;
  for (const CommitBatch& batch : job.batches) {
    auto written = BatchWriter(**transaction, bootId_, job, batch, outcome).write();
    if (!written) return written;
    hasUndated = hasUndated || (!batch.day && !batch.originOnClock);
  }
  if (job.wallMinusBoot || hasUndated) {
    const auto forgotten =
        (*transaction)->forgetUndated(job.wallMinusBoot ? std::optional(job.today) : std::nullopt);
    if (!forgotten) return forgotten.error();
    outcome.undatedForgotten += *forgotten;
  }
  if (job.ran) {
    const auto wanted = (*transaction)->isWanted(OwnMetric::RecorderRan, job.today);
    if (!wanted) return wanted.error();
    outcome.countsRunning = *wanted;
    if (*wanted) {
      if (auto added = addRunning(**transaction, *job.ran); !added) return added;
    }
  }
  return (*transaction)->commit();
}

}  // namespace tally
