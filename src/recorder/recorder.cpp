#include "recorder/recorder.h"

#include <algorithm>
#include <utility>

#include "base/time_text.h"

namespace tally {
namespace {

constexpr std::int64_t kSecond = 1'000'000'000;  // in nanoseconds
// After a commit that failed: a full disk or a locked store may take a while.
constexpr std::int64_t kRetryAfter = 60 * kSecond;
// A socket-activated recorder ends after so many intervals without a metric: who records now and
// then is not to start it each time.
constexpr std::int64_t kQuietIntervals = 2;

}  // namespace

Recorder::Recorder(RecorderParts parts)
    : parts_(std::move(parts)),
      intake_(parts_.readSettings(), parts_.log),
      clock_(parts_.clockIsSynchronised),
      committer_(parts_.store, parts_.bootId, [this] { parts_.ingress.wake(); }) {}

std::int64_t Recorder::interval() const {
  return intake_.settings().number(RecorderNumber::CommitInterval) * kSecond;
}

void Recorder::beginRound(std::int64_t bootNanoseconds, double secondsSince1970) {
  secondsSince1970_ = secondsSince1970;
  if (intake_.keys() == nullptr) {
    commits_.startedAt = ranCountedUntil_ = bootNanoseconds;
    const auto newest = parts_.store.newestDay();
    if (newest) {
      clock_.setNewestDay(*newest);
    } else {
      parts_.log.fault("recorder: store", "{}", newest.error().message);
    }
  }
  now_ = clock_.at(bootNanoseconds, secondsSince1970);
  if (intake_.keys() == nullptr || intake_.keys()->day() != now_.day) {
    beginDay();
  } else {
    intake_.setNow(now_);
  }
}

void Recorder::beginDay() {
  const HeldKeys* const former = intake_.keys();
  std::vector<KeyOwner> owners;
  // After a day that came to its end nobody has recorded in the next one yet.
  if (now_.day && (former == nullptr || !former->day() || *former->day() > *now_.day)) {
    auto read =
        committer_.withStore([&](RecordingStore& store) { return store.owners(*now_.day); });
    if (read) {
      owners = *std::move(read);
    } else {
      parts_.log.fault("recorder: store", "{}", read.error().message);
    }
  }
  dateUndated_ = dateUndated_ || (now_.day && former != nullptr && !former->day());
  intake_.beginDay(now_, owners);
}

void Recorder::onLines(Sender sender, std::string_view lines) {
  intake_.recordLines(sender, lines);
}

void Recorder::onLoss(IngressLoss loss, Sender sender, std::uint64_t count) {
  static constexpr Refusal kOfLoss[] = {Refusal::Truncated, Refusal::LongLine,
                                        Refusal::SocketOverflow, Refusal::NoCredentials,
                                        Refusal::Connections};
  intake_.refuse(sender, kOfLoss[static_cast<std::size_t>(loss)], count);
}

std::size_t Recorder::streamQuota(Sender sender) { return intake_.allowedBytes(sender); }

void Recorder::onReload() {
  RecorderSettings settings = parts_.readSettings();
  if (!settings.complete) {
    return parts_.log.write(LogLevel::Error, "the settings stay as they were");
  }
  intake_.setSettings(std::move(settings));
  parts_.log.write(LogLevel::Default, "settings read again");
}

void Recorder::onControl(ControlRequest request, std::string_view line) {
  if (line == "status") {
    parts_.ingress.answer(request, recorderStatusText(intake_, commits_, now_));
  } else if (line == "commit" || line == "forget") {
    controls_.push_back({request, Control::State::Received, 0, line == "forget"});
  } else {
    parts_.ingress.answer(request, "failed: not a request\n");
  }
}

void Recorder::takeUpControls() {
  for (Control& control : controls_) {
    if (control.state == Control::State::Received) {
      // Datagrams that are queued came before the request: they are read in the next round.
      control.state = Control::State::Due;
    } else if (control.state == Control::State::Due) {
      control.state = Control::State::Waiting;
      // A commit that is under way may have begun before what is asked for had arrived.
      control.afterCommit = control.forgets ? commits_.started : commits_.started + 1;
      (control.forgets ? askedToForget_ : askedToCommit_) = true;
    }
  }
}

void Recorder::answerControls() {
  std::erase_if(controls_, [&](const Control& control) {
    if (control.state != Control::State::Waiting || commits_.ended < control.afterCommit) {
      return false;
    }
    const bool done = control.forgets || commits_.failure.empty();
    parts_.ingress.answer(control.request, done ? "done\n" : "failed: " + commits_.failure + "\n");
    return true;
  });
}

bool Recorder::commitIsDue() const {
  if (terminating_ || askedToCommit_) return true;
  return now_.bootNanoseconds >= retryAt_ && (durableIsDue() || allIsDue());
}

bool Recorder::durableIsDue() const {
  const auto due = intake_.durableDue();
  return due && now_.bootNanoseconds >= *due;
}

bool Recorder::allIsDue() const {
  const auto since = intake_.heldSince();
  return terminating_ || askedToCommit_ || intake_.hasWaiting() ||
         (since && (now_.bootNanoseconds - *since >= interval() || intake_.isHalfFull()));
}

bool Recorder::startCommit() {
  const bool durableAlone = !allIsDue();
  CommitJob job;
  job.batches = intake_.take(terminating_   ? MetricIntake::Take::AllAtEnd
                             : durableAlone ? MetricIntake::Take::Durable
                                            : MetricIntake::Take::All);
  askedToCommit_ = false;
  job.today = now_.day.value_or(0);
  if (now_.day && std::exchange(dateUndated_, false)) job.wallMinusBoot = now_.wallMinusBoot;
  if (job.batches.empty() && !job.wallMinusBoot && !(countsRunning_ && now_.day)) return false;
  if (now_.day) job.ran = {ranCountedUntil_, now_.bootNanoseconds, now_.wallMinusBoot};
  ++commits_.started;
  committer_.start(std::move(job));
  return true;
}

bool Recorder::endCommit() {
  auto outcome = committer_.takeOutcome();
  if (!outcome) return false;
  ++commits_.ended;
  if (outcome->status) {
    if (const auto& ran = outcome->job.ran) {
      ranCountedUntil_ = ran->until;
      countsRunning_ = outcome->countsRunning;
    }
    for (const CommitBatch& batch : outcome->job.batches) intake_.forget(batch);
    std::vector<KeyOwner> foreign;
    for (auto& [day, owner] : outcome->foreign) {
      // The keys of a day that has ended are free again.
      if (intake_.keys()->day() == day) foreign.push_back(std::move(owner));
    }
    intake_.yieldKeys(foreign, outcome->refused);
    if (outcome->undatedForgotten > 0) {
      intake_.count(RecorderCount::UndatedDropped, outcome->undatedForgotten);
    }
    commits_.lastSuccess = secondsSince1970_;
    retryAt_ = 0;
    if (!std::exchange(commits_.failure, {}).empty()) {
      parts_.log.write(LogLevel::Default, "the store can be written again");
    }
    return true;
  }
  ++commits_.failed;
  const std::string& message = outcome->status.error().message;
  if (message != commits_.failure) {
    parts_.log.message(LogLevel::Error, "{}; what was recorded stays in memory", message);
  }
  commits_.failure = message;
  retryAt_ = now_.bootNanoseconds + kRetryAfter;
  dateUndated_ = dateUndated_ || outcome->job.wallMinusBoot.has_value();
  intake_.putBack(std::move(outcome->job.batches));
  return false;
}

bool Recorder::commitRunning() {
  // Once since the last line: a store that cannot be written must not keep it running.
  if (!countsRunning_ ||
      std::exchange(runningCommittedAt_, intake_.lastLineAt()) == intake_.lastLineAt()) {
    return false;
  }
  return startCommit();
}

bool Recorder::mayEnd() const {
  return parts_.ingress.isActivated() && !parts_.ingress.hasConnections() && !intake_.heldSince() &&
         !intake_.hasWaiting() && !committer_.isBusy() &&
         now_.bootNanoseconds - std::max(intake_.lastLineAt(), commits_.startedAt) >=
             kQuietIntervals * interval();
}

void Recorder::end() {
  if (hasUncommitted()) {
    parts_.log.message(LogLevel::Error, "ending with {} samples that could not be committed",
                       intake_.samples());
  }
  parts_.ingress.stop();
}

std::optional<std::int64_t> Recorder::endRound() {
  const bool committed = endCommit();
  if (intake_.bytes() > intake_.mostBytes()) intake_.thin();
  takeUpControls();
  if (!committer_.isBusy()) {
    // Before the next commit, which would write it to the store that is being erased.
    if (std::exchange(askedToForget_, false)) intake_.discard();
    // A commit may leave counts of its own, which one more takes along.
    if (terminating_ && finalCommitBegan_ && (!commits_.failure.empty() || !hasUncommitted())) {
      end();
    } else if (commitIsDue()) {
      finalCommitBegan_ = terminating_;
      // What arrives from now on is for the next process, if systemd holds the sockets.
      if (terminating_) parts_.ingress.stopReading();
      if (!startCommit()) {
        // Nothing was left to do for those who asked.
        for (Control& control : controls_) {
          control.afterCommit = std::min(control.afterCommit, commits_.ended);
        }
        if (terminating_) end();
      }
    }
  }
  answerControls();
  if (committed) parts_.onCommitted();
  if (mayEnd() && !commitRunning()) parts_.ingress.stop();
  return nextRound();
}

std::optional<std::int64_t> Recorder::nextRound() const {
  const auto isDue = [](const Control& control) { return control.state == Control::State::Due; };
  if (std::ranges::any_of(controls_, isDue)) return 0;
  if (committer_.isBusy()) return std::nullopt;  // its end begins a round
  std::optional<std::int64_t> at;
  const auto noLaterThan = [&](std::int64_t other) { at = at ? std::min(*at, other) : other; };
  if (const auto since = intake_.heldSince()) {
    noLaterThan(*since + interval());
    const double untilMidnight =
        static_cast<double>(dayOfSeconds(secondsSince1970_) + 1) * kSecondsPerDay -
        secondsSince1970_;
    noLaterThan(now_.bootNanoseconds +
                static_cast<std::int64_t>((untilMidnight + 1) * static_cast<double>(kSecond)));
  }
  if (intake_.hasWaiting()) noLaterThan(now_.bootNanoseconds);
  if (const auto due = intake_.durableDue()) noLaterThan(*due);
  if (at && retryAt_ > 0) at = std::max(*at, retryAt_);
  if (parts_.ingress.isActivated() && !parts_.ingress.hasConnections() && !hasUncommitted()) {
    noLaterThan(std::max(intake_.lastLineAt(), commits_.startedAt) + kQuietIntervals * interval());
  }
  if (!at) return std::nullopt;
  return std::max<std::int64_t>(*at - now_.bootNanoseconds, 0);
}

}  // namespace tally
