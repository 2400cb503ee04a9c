// When and what the recorder commits, and what it does when memory runs out.
#include <algorithm>
#include <utility>

#include "base/time_text.h"
#include "recorder/recorder.h"

namespace tally {
namespace {

constexpr std::int64_t kNanosecond = 1'000'000'000;  // that make a second
// After a commit that failed: a full disk or a locked store may take a while.
constexpr std::int64_t kRetryAfter = 60 * kNanosecond;

}  // namespace

CommitBatch Recorder::takeBatch(bool durableAlone, bool atEnd) {
  CommitBatch batch;
  batch.keys = keys_;
  batch.day = keys_->day();
  batch.origin = keys_->origin();
  if (atEnd) {
    // What is left below one is in keys that may not have changed since the last commit.
    for (std::uint32_t i = 0; i < keys_->size(); ++i) keys_->markDirty(i);
  }
  for (const std::uint32_t index : keys_->takeDirty()) {
    HeldKey& key = keys_->at(index);
    key.dirty = false;
    if (durableAlone && !key.durable) {
      keys_->markDirty(index);
    } else {
      takeChange(batch, key, atEnd);
    }
  }
  durableWaits_ = false;
  if (!durableAlone) {
    takeCounts(batch);
    heldSince_.reset();
  }
  return batch;
}

void Recorder::takeChange(CommitBatch& batch, HeldKey& key, bool atEnd) {
  const std::int64_t user = users_.at(key.user).sender.user;
  if (const auto change = key.scalar.take(atEnd)) {
    if (change->clamped) count(RecorderCount::ValuesClamped);
    batch.changes.push_back({key.key, change->kind, change->value, nullptr, key.user, user});
  }
  if (key.samples) {
    batch.changes.push_back({key.key, RecordedChange::Kind::Samples, 0,
                             std::exchange(key.samples, nullptr), key.user, user});
  }
  if (std::exchange(key.isNew, false)) {
    batch.owners.push_back({std::string(key.key), user, key.type == HeldType::Distribution});
  }
}

void Recorder::takeCounts(CommitBatch& batch) {
  const auto take = [&](std::string_view key, std::uint64_t now, std::uint64_t& taken) {
    const std::uint64_t more = now - std::exchange(taken, now);
    if (more == 0) return;
    batch.changes.push_back(
        {key, RecordedChange::Kind::Add, static_cast<std::int64_t>(more), nullptr, 0, 0});
  };
  for (std::size_t i = 0; i < kRefusalCount; ++i) {
    take(kRefusals[i].key, refused_[i], refusedTaken_[i]);
  }
  for (std::size_t i = 0; i < kRecorderCountCount; ++i) {
    take(kRecorderCounts[i].key, counts_[i], countsTaken_[i]);
  }
}

bool Recorder::commitIsDue() const {
  const bool asked = terminating_ || askedToCommit_;
  if (!asked && bootNanoseconds_ < retryAt_) return false;
  if (asked || !ended_.empty() || durableWaits_) return true;
  if (!heldSince_) return false;
  const std::int64_t interval =
      rules_.settings().number(RecorderNumber::CommitInterval) * kNanosecond;
  return bootNanoseconds_ - *heldSince_ >= interval || sampleBytes_ >= memoryForData() / 2;
}

void Recorder::startCommit(bool durableAlone) {
  CommitJob job;
  job.batches.assign(std::make_move_iterator(ended_.begin()),
                     std::make_move_iterator(ended_.end()));
  ended_.clear();
  CommitBatch batch = takeBatch(durableAlone, /*atEnd=*/terminating_);
  if (!batch.changes.empty()) job.batches.push_back(std::move(batch));
  if (now_.day && std::exchange(dateUndated_, false)) {
    job.wallMinusBoot = now_.wallMinusBoot;
    job.today = *now_.day;
  }
  askedToCommit_ = false;
  if (job.batches.empty() && !job.wallMinusBoot) return;
  ++commitsStarted_;
  committer_.start(std::move(job));
}

void Recorder::returnMemory(const CommitBatch& batch) {
  for (const CommitBatch::Change& change : batch.changes) {
    if (!change.samples) continue;
    const std::size_t bytes = change.samples->bytes() + sizeof(SampleStream);
    sampleBytes_ -= bytes;
    users_.at(change.user).bytes -= bytes;
    samplesHeld_ -= change.samples->count();
  }
}

void Recorder::endCommit() {
  auto outcome = committer_.takeOutcome();
  if (!outcome) return;
  ++commitsEnded_;
  if (outcome->status) {
    for (const CommitBatch& batch : outcome->job.batches) returnMemory(batch);
    if (outcome->undatedForgotten > 0) {
      count(RecorderCount::UndatedDropped, outcome->undatedForgotten);
    }
    lastCommitAt_ = secondsSince1970_;
    retryAt_ = 0;
    if (!std::exchange(lastFailure_, {}).empty()) {
      parts_.log.write(LogLevel::Default, "the store can be written again");
    }
    return;
  }
  ++commitsFailed_;
  const std::string& message = outcome->status.error().message;
  if (message != lastFailure_) {
    parts_.log.message(LogLevel::Error, "{}; what was recorded stays in memory", message);
  }
  lastFailure_ = message;
  retryAt_ = bootNanoseconds_ + kRetryAfter;
  dateUndated_ = dateUndated_ || outcome->job.wallMinusBoot.has_value();
  auto& batches = outcome->job.batches;
  for (CommitBatch& batch : batches) {
    if (!batch.day && now_.day) {
      batch.originOnClock = now_.wallMinusBoot + static_cast<double>(batch.origin);
    }
  }
  ended_.insert(ended_.begin(), std::make_move_iterator(batches.begin()),
                std::make_move_iterator(batches.end()));
}

void Recorder::answerControls() {
  std::erase_if(controls_, [&](const Control& control) {
    if (control.state != Control::State::Waiting || commitsEnded_ < control.afterCommit) {
      return false;
    }
    parts_.ingress.answer(control.request,
                          lastFailure_.empty() ? "done\n" : "failed: " + lastFailure_ + "\n");
    return true;
  });
}

void Recorder::onControl(ControlRequest request, std::string_view line) {
  if (line == "status") {
    parts_.ingress.answer(request, statusText());
  } else if (line == "commit") {
    // Datagrams that are queued came before the request: they are read in the round that follows.
    controls_.push_back({request, Control::State::Received, 0});
    parts_.ingress.wake();
  } else {
    parts_.ingress.answer(request, "failed: not a request\n");
  }
}

bool Recorder::mayEnd() const {
  // Whoever records now and then is not to start the program each time.
  const std::int64_t interval =
      rules_.settings().number(RecorderNumber::CommitInterval) * kNanosecond;
  return parts_.ingress.isActivated() && !parts_.ingress.hasConnections() && !heldSince_ &&
         ended_.empty() && bootNanoseconds_ - lastLineAt_ >= 2 * interval;
}

std::optional<std::int64_t> Recorder::endRound() {
  endCommit();
  if (bytes() > memoryForData()) thin();
  for (Control& control : controls_) {
    if (control.state == Control::State::Received) {
      control.state = Control::State::Due;
    } else if (control.state == Control::State::Due) {
      // A commit that is under way may have begun before what is asked for had arrived.
      control = {control.request, Control::State::Waiting, commitsStarted_ + 1};
      askedToCommit_ = true;
    }
  }
  if (!committer_.isBusy() && commitIsDue()) {
    const bool durableAlone = durableWaits_ && !terminating_ && !askedToCommit_;
    const std::uint64_t before = commitsStarted_;
    startCommit(durableAlone && ended_.empty());
    if (commitsStarted_ == before) {
      // Nothing to commit: what was asked for is done.
      for (Control& control : controls_) {
        control.afterCommit = std::min(control.afterCommit, commitsEnded_);
      }
      if (terminating_) parts_.ingress.stop();
    }
  }
  answerControls();
  if (terminating_ && !committer_.isBusy() && !lastFailure_.empty()) {
    parts_.log.message(LogLevel::Error, "ending with {} samples that could not be committed",
                       samplesHeld_);
    parts_.ingress.stop();
  }
  if (mayEnd() && !committer_.isBusy()) parts_.ingress.stop();
  return nextRound();
}

std::optional<std::int64_t> Recorder::nextRound() const {
  const auto isDue = [](const Control& control) { return control.state == Control::State::Due; };
  if (std::ranges::any_of(controls_, isDue)) return 0;
  if (committer_.isBusy()) return std::nullopt;  // its end begins a round
  std::optional<std::int64_t> at;
  const auto noLaterThan = [&](std::int64_t other) { at = at ? std::min(*at, other) : other; };
  const std::int64_t interval =
      rules_.settings().number(RecorderNumber::CommitInterval) * kNanosecond;
  if (heldSince_) {
    noLaterThan(*heldSince_ + interval);
    const double untilMidnight =
        static_cast<double>(dayOfSeconds(secondsSince1970_) + 1) * kSecondsPerDay -
        secondsSince1970_;
    noLaterThan(bootNanoseconds_ + static_cast<std::int64_t>((untilMidnight + 1) * 1e9));
  }
  if (!ended_.empty()) noLaterThan(bootNanoseconds_);
  if (at && retryAt_ > 0) at = std::max(*at, retryAt_);
  if (parts_.ingress.isActivated() && !parts_.ingress.hasConnections()) {
    noLaterThan(lastLineAt_ + 2 * interval);
  }
  if (!at) return std::nullopt;
  return std::max<std::int64_t>(*at - bootNanoseconds_, 0);
}

std::uint64_t Recorder::thinned(SampleStream& samples, std::uint32_t user) {
  const std::size_t before = samples.bytes();
  const std::uint64_t gone = samples.thin();
  const std::size_t less = before - std::min(before, samples.bytes());
  sampleBytes_ -= less;
  users_.at(user).bytes -= less;
  samplesHeld_ -= gone;
  return gone;
}

bool Recorder::thinOldest(std::uint32_t user) {
  std::uint64_t gone = 0;
  for (std::size_t i = 0; i < ended_.size() && gone == 0; ++i) {
    for (CommitBatch::Change& change : ended_[i].changes) {
      if (change.samples && change.user == user) gone += thinned(*change.samples, user);
    }
  }
  for (const std::uint32_t index : gone == 0 ? keys_->dirty() : std::vector<std::uint32_t>()) {
    HeldKey& key = keys_->at(index);
    if (key.samples && key.user == user) gone += thinned(*key.samples, user);
  }
  count(RecorderCount::SamplesThinned, gone);
  return gone > 0;
}

void Recorder::thin() {
  // Whoever takes most gives first, so that a flood displaces its own samples alone. A margin, so
  // that not every further sample thins again.
  const std::size_t enough = memoryForData() - memoryForData() / 8;
  std::vector<bool> exhausted(users_.all().size(), false);
  while (bytes() > enough) {
    std::size_t most = users_.all().size();
    for (std::size_t i = 0; i < users_.all().size(); ++i) {
      const bool has = !exhausted[i] && users_.all()[i].bytes > 0;
      if (has &&
          (most == users_.all().size() || users_.all()[i].bytes > users_.all()[most].bytes)) {
        most = i;
      }
    }
    if (most == users_.all().size()) return;
    if (!thinOldest(static_cast<std::uint32_t>(most))) exhausted[most] = true;
  }
}

}  // namespace tally
