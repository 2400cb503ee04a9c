#include "recorder/metric_intake.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <iterator>
#include <utility>

#include "base/time_text.h"

namespace tally {
namespace {

// Rates below are taken as this: a weight stays a number that a day can have.
constexpr double kLeastRate = 1e-6;
// What the program takes beside what it holds: its code's data, the datagrams that were just read,
// the store's buffers, the stack of the commit.
constexpr std::size_t kMemoryOfProgram = 8 << 20;
// Of the keys of a day, the last quarter is for users who have few.
constexpr std::uint64_t kFewKeys = 100;

ScalarAmount amountOf(const MetricValue& value) {
  return value.whole ? ScalarAmount{.whole = *value.whole} : ScalarAmount::of(value.number);
}

}  // namespace

std::size_t MetricIntake::mostBytes() const {
  const auto limit = static_cast<std::size_t>(settings().number(RecorderNumber::MemoryLimit));
  return limit - std::min(kMemoryOfProgram, limit / 2);
}

std::size_t MetricIntake::bytes() const {
  std::size_t bytes = sampleBytes_ + (keys_ ? keys_->bytes() : 0);
  for (const CommitBatch& batch : waiting_) {
    bytes += batch.keys->bytes() + batch.changes.size() * sizeof(CommitBatch::Change);
  }
  return bytes;
}

void MetricIntake::beginDay(const RecordingMoment& moment, std::span<const KeyOwner> owners) {
  if (keys_) {
    CommitBatch batch = takeBatch(Take::AllAtEnd);
    if (!batch.empty()) waiting_.push_back(std::move(batch));
  }
  setNow(moment);
  dateWaiting();
  users_.beginDay();
  keys_ = std::make_shared<HeldKeys>(moment.day, moment.bootSeconds);
  for (const KeyOwner& owner : owners) addOwned(owner);
}

// What was recorded before the clock was set is dated once it is.
void MetricIntake::dateWaiting() {
  if (!now_.day) return;
  for (CommitBatch& batch : waiting_) {
    if (batch.day || batch.originOnClock) continue;
    batch.originOnClock = now_.wallMinusBoot + static_cast<double>(batch.origin);
  }
}

void MetricIntake::setSettings(RecorderSettings settings) {
  rules_ = KeyRules(std::move(settings));
  keys_->forgetIdentities();
  for (std::uint32_t i = 0; i < keys_->size(); ++i) applyRules(keys_->at(i));
}

void MetricIntake::applyRules(HeldKey& key) {
  key.durable = rules_.isDurable(key.key);
  key.revoked = !rules_.mayRecord(users_.at(key.user).sender.user, key.key);
}

void MetricIntake::addOwned(const KeyOwner& owner) {
  if (keys_->findKey(owner.key) != HeldKeys::kNone) return;
  const std::uint32_t user = users_.indexOf({owner.user}, settings());
  HeldKey& key = keys_->at(keys_->addKey(owner.key));
  key.user = user;
  key.type = owner.distribution ? HeldType::Distribution : HeldType::None;
  applyRules(key);
  ++users_.at(user).keysToday;
}

void MetricIntake::recordLines(Sender sender, std::string_view lines) {
  lastLineAt_ = now_.bootNanoseconds;
  const std::uint32_t user = users_.indexOf(sender, settings());
  MetricLine metric;
  while (!lines.empty()) {
    const void* const newline = std::memchr(lines.data(), '\n', lines.size());
    const std::size_t end =
        newline == nullptr
            ? lines.size()
            : static_cast<std::size_t>(static_cast<const char*>(newline) - lines.data());
    std::string_view line = lines.substr(0, end);
    lines.remove_prefix(std::min(end + 1, lines.size()));
    if (line.ends_with('\r')) line.remove_suffix(1);
    if (line.empty()) continue;
    metric.name = {};
    if (const auto refused = parseMetricLine(line, metric, values_)) {
      values_.resize(1);  // the line counts once
      refuseLine(user, *refused, metric, metric.name);
    } else {
      record(user, metric);
    }
  }
}

void MetricIntake::record(std::uint32_t user, const MetricLine& metric) {
  if (!users_.admit(users_.at(user), values_.size(), now_.bootNanoseconds, settings())) {
    return refuseLine(user, Refusal::MetricsPerSecond, metric,
                      rules_.identityOf(metric.name, metric.tags, identity_));
  }
  const std::uint32_t index = keyFor(user, metric);
  if (index == HeldKeys::kNone) return;
  HeldKey& key = keys_->at(index);
  if (key.revoked) {
    if (!rules_.mayRecord(users_.at(user).sender.user, key.key)) {
      return refuseKey(user, Refusal::Permission, key, values_.size());
    }
    key.user = user;  // whoever had it lost the right to it
    key.revoked = false;
  }
  if (key.user != user) return refuseKey(user, Refusal::Owner, key, values_.size());
  if (metric.skippedSections > 0) count(RecorderCount::SectionsSkipped, metric.skippedSections);
  keys_->markDirty(index);
  addValues(key, user, metric);
  if (key.durable) markDurable(user);
  markHeld();
  users_.at(user).metrics += values_.size();
  metrics_ += values_.size();
}

std::uint32_t MetricIntake::keyFor(std::uint32_t user, const MetricLine& metric) {
  const std::string_view identity = rules_.identityOf(metric.name, metric.tags, identity_);
  const std::uint32_t index = keys_->find(identity);
  if (index != HeldKeys::kNone) return index;
  if (const auto loss = clientLossOf(metric.name)) {
    double lost = 0;
    for (const MetricValue& value : values_) lost += std::max(value.number, 0.0) / metric.rate;
    constexpr double kMostBelieved = 1e9;
    count(*loss, static_cast<std::uint64_t>(std::min(lost, kMostBelieved)));
    return HeldKeys::kNone;
  }
  return addKey(user, metric, identity);
}

std::uint32_t MetricIntake::addKey(std::uint32_t user, const MetricLine& metric,
                                   std::string_view identity) {
  const auto refused = [&](Refusal refusal) {
    refuseLine(user, refusal, metric, identity);
    return HeldKeys::kNone;
  };
  if (!isRecordableName(identity)) return refused(Refusal::Name);
  const std::string key = rules_.keyOf(metric.name, identity);
  if (!isRecordableName(key)) return refused(Refusal::Name);
  std::uint32_t index = keys_->findKey(key);
  if (index != HeldKeys::kNone) {
    keys_->addIdentity(identity, index);
    return index;
  }
  RecordingUser& recording = users_.at(user);
  const auto limit = [&](RecorderNumber which) {
    return static_cast<std::uint64_t>(settings().number(which));
  };
  if (!rules_.mayRecord(recording.sender.user, key)) return refused(Refusal::Permission);
  if (recording.keysToday >= limit(RecorderNumber::KeysOfUser)) return refused(Refusal::KeysOfUser);
  const std::uint64_t mostKeys = limit(RecorderNumber::KeysOfDay);
  const bool hasFew = recording.keysToday < kFewKeys;
  if (keys_->size() >= (hasFew ? mostKeys : mostKeys / 4 * 3)) return refused(Refusal::KeysOfDay);
  // Keys stay all day, samples only until they are committed, so these need their share.
  if (keys_->bytes() >= mostBytes() / 2 || bytes() >= mostBytes()) return refused(Refusal::Memory);
  index = keys_->add(identity, key);
  HeldKey& held = keys_->at(index);
  held.user = user;
  held.isNew = true;
  applyRules(held);
  ++recording.keysToday;
  return index;
}

void MetricIntake::noteType(HeldKey& key, LineType type) {
  const HeldType now = type == LineType::Counter ? HeldType::Counter
                       : type == LineType::Gauge ? HeldType::Gauge
                                                 : HeldType::Distribution;
  if (key.type == now) return;
  // Of a key that an earlier process recorded only this is known: it is not a distribution.
  const bool first = key.type == HeldType::None && (key.isNew || now != HeldType::Distribution);
  key.type = now;
  if (first || key.twoTypes) return;
  key.twoTypes = true;
  count(RecorderCount::KeysOfTwoTypes);
  log_.repeated(LogLevel::Default, "recorder: keys of two types",
                "the key {} is recorded as two types", key.key);
}

void MetricIntake::addValues(HeldKey& key, std::uint32_t user, const MetricLine& metric) {
  noteType(key, metric.type);
  double rate = metric.rate;
  if (rate < kLeastRate) {
    rate = kLeastRate;
    count(RecorderCount::RatesBounded);
  }
  for (const MetricValue& value : values_) {
    switch (metric.type) {
      case LineType::Counter:
        key.scalar.add(rate == 1 ? amountOf(value) : ScalarAmount::of(value.number / rate));
        break;
      case LineType::Gauge:
        if (value.isSigned) {
          key.scalar.move(amountOf(value));
        } else {
          key.scalar.set(amountOf(value));
        }
        break;
      case LineType::Duration:
      case LineType::Sample:
        addSample(key, user, value.number, rate);
        break;
    }
  }
}

void MetricIntake::addSample(HeldKey& key, std::uint32_t user, double value, double rate) {
  std::uint32_t weight = 1;
  if (rate != 1) {
    // A weight is whole; what it leaves is added to the next one, so that counts are right.
    const double exact = 1 / rate + static_cast<double>(key.weightLeft);
    weight = static_cast<std::uint32_t>(std::max(std::round(exact), 1.0));
    key.weightLeft = static_cast<float>(exact - weight);
  }
  if (bytes() > mostBytes()) {
    thin();
    // Everything may be in the commit that is under way.
    if (bytes() > mostBytes()) return refuseKey(user, Refusal::Memory, key, 1);
  }
  if (!key.samples) {
    key.samples = std::make_unique<SampleStream>();
    growSamples(user, sizeof(SampleStream));
  }
  const std::int64_t offset = now_.day ? now_.secondOfDay : now_.bootSeconds - keys_->origin();
  growSamples(user,
              key.samples->add(value, static_cast<std::uint32_t>(std::max<std::int64_t>(offset, 0)),
                               weight));
  ++samples_;
}

void MetricIntake::refuse(Sender sender, Refusal refusal, std::uint64_t count) {
  refuseFor(users_.indexOf(sender, settings()), refusal, count);
}

void MetricIntake::refuseFor(std::uint32_t user, Refusal refusal, std::uint64_t count) {
  const auto which = static_cast<std::size_t>(refusal);
  refused_[which] += count;
  users_.at(user).refused[which] += count;
  markHeld();
}

void MetricIntake::refuseLine(std::uint32_t user, Refusal refusal, const MetricLine& metric,
                              std::string_view identity) {
  refuseFor(user, refusal, values_.size());
  const bool typed =
      refusal != Refusal::Malformed && refusal != Refusal::Type && refusal != Refusal::Set;
  const bool scalar = metric.type == LineType::Counter || metric.type == LineType::Gauge;
  refusedNames_.note({identity, metric.name.size(), refusal,
                      !typed   ? RefusedNames::Kind::Unknown
                      : scalar ? RefusedNames::Kind::Scalar
                               : RefusedNames::Kind::Distribution,
                      now_.day, values_.size()});
}

void MetricIntake::refuseKey(std::uint32_t user, Refusal refusal, const HeldKey& key,
                             std::uint64_t count) {
  refuseFor(user, refusal, count);
  refusedNames_.note({key.key, 0, refusal, RefusedNames::Kind::Unknown, now_.day, count});
}

std::string MetricIntake::keyOf(const RefusedNames::Row& row) const {
  if (row.nameLength == 0) return std::string(row.text);
  return rules_.keyOf(row.text.substr(0, row.nameLength), row.text);
}

void MetricIntake::markHeld() {
  if (!heldSince_) heldSince_ = now_.bootNanoseconds;
}

void MetricIntake::markDurable(std::uint32_t user) {
  const std::int64_t due = users_.durableDue(users_.at(user), now_.bootNanoseconds);
  durableDue_ = durableDue_ ? std::min(*durableDue_, due) : due;
}

void MetricIntake::yieldKeys(std::span<const KeyOwner> owners, std::uint64_t changes) {
  refused_[static_cast<std::size_t>(Refusal::Owner)] += changes;
  if (changes > 0) markHeld();
  for (const KeyOwner& owner : owners) {
    refusedNames_.note({owner.key, 0, Refusal::Owner, RefusedNames::Kind::Unknown, now_.day, 1});
    const std::uint32_t index = keys_->findKey(owner.key);
    if (index != HeldKeys::kNone) keys_->at(index).user = users_.indexOf({owner.user}, settings());
  }
}

void MetricIntake::count(RecorderCount which, std::uint64_t amount) {
  std::uint64_t& count = counts_[static_cast<std::size_t>(which)];
  count += std::min(amount, kMostCounted - count);
  if (amount > 0) markHeld();
}

void MetricIntake::growSamples(std::uint32_t user, std::size_t bytes) {
  sampleBytes_ += bytes;
  users_.at(user).bytes += bytes;
}

std::size_t MetricIntake::allowedBytes(Sender sender) {
  constexpr double kBytesOfMetric = 2;  // the shortest, in a line of many values
  constexpr double kLeast = 64;         // metrics, so that reading is worth it
  constexpr double kMost = 1 << 20;
  RecordingUser& user = users_.at(users_.indexOf(sender, settings()));
  (void)users_.admit(user, 0, now_.bootNanoseconds, settings());
  if (user.allowance < kLeast) return 0;
  return static_cast<std::size_t>(std::min(user.allowance * kBytesOfMetric, kMost));
}

std::vector<CommitBatch> MetricIntake::take(Take which) {
  std::vector<CommitBatch> batches(std::make_move_iterator(waiting_.begin()),
                                   std::make_move_iterator(waiting_.end()));
  waiting_.clear();
  CommitBatch batch = takeBatch(which);
  if (!batch.empty()) batches.push_back(std::move(batch));
  return batches;
}

void MetricIntake::putBack(std::vector<CommitBatch> batches) {
  std::deque<CommitBatch> former;
  for (CommitBatch& batch : batches) {
    if (batch.keys == keys_) {
      putBackHeld(batch);
    } else {
      former.push_back(std::move(batch));
    }
  }
  waiting_.insert(waiting_.begin(), std::make_move_iterator(former.begin()),
                  std::make_move_iterator(former.end()));
  dateWaiting();
}

void MetricIntake::putBackHeld(CommitBatch& batch) {
  markHeld();
  for (CommitBatch::Change& change : batch.changes) {
    HeldKey& key = keys_->at(change.index);
    keys_->markDirty(change.index);
    if (key.durable) markDurable(key.user);
    if (!change.samples) {
      key.scalar.putBack({change.kind, change.value, false});
      continue;
    }
    if (key.samples) {
      // Both are counted; the one that is added to the other goes.
      const std::size_t gone = key.samples->bytes() + sizeof(SampleStream);
      growSamples(change.user, change.samples->append(*key.samples));
      sampleBytes_ -= gone;
      users_.at(change.user).bytes -= gone;
    }
    key.samples = std::move(change.samples);
  }
  for (const KeyOwner& owner : batch.owners) {
    const std::uint32_t index = keys_->findKey(owner.key);
    if (index != HeldKeys::kNone) keys_->at(index).isNew = true;
  }
  for (std::size_t i = 0; i < kRefusalCount; ++i) refusedTaken_[i] -= batch.refused[i];
  for (std::size_t i = 0; i < kRecorderCountCount; ++i) countsTaken_[i] -= batch.counts[i];
}

CommitBatch MetricIntake::takeBatch(Take which) {
  CommitBatch batch;
  batch.keys = keys_;
  batch.day = keys_->day();
  batch.origin = keys_->origin();
  if (which == Take::AllAtEnd) {
    // What is left below one is in keys that may not have changed since the last commit.
    for (std::uint32_t i = 0; i < keys_->size(); ++i) keys_->markDirty(i);
  }
  for (const std::uint32_t index : keys_->takeDirty()) {
    HeldKey& key = keys_->at(index);
    key.dirty = false;
    if (which == Take::Durable && !key.durable) {
      keys_->markDirty(index);
    } else {
      takeChange(batch, index, which == Take::AllAtEnd);
    }
  }
  durableDue_.reset();
  users_.endDurable();
  if (which != Take::Durable) {
    takeCounts(batch);
    heldSince_.reset();
  }
  return batch;
}

void MetricIntake::takeChange(CommitBatch& batch, std::uint32_t index, bool atEnd) {
  HeldKey& key = keys_->at(index);
  const std::int64_t user = users_.at(key.user).sender.user;
  if (const auto change = key.scalar.take(atEnd)) {
    if (change->clamped) count(RecorderCount::ValuesClamped);
    batch.changes.push_back({key.key, change->kind, change->value, nullptr, key.user, user, index});
  }
  if (key.samples) {
    batch.changes.push_back({key.key, RecordedChange::Kind::Samples, 0,
                             std::exchange(key.samples, nullptr), key.user, user, index});
  }
  if (std::exchange(key.isNew, false)) {
    batch.owners.push_back({std::string(key.key), user, key.type == HeldType::Distribution});
  }
}

void MetricIntake::takeCounts(CommitBatch& batch) {
  const auto take = [](const auto& now, auto& taken, auto& more) {
    for (std::size_t i = 0; i < now.size(); ++i) {
      more[i] = now[i] - std::exchange(taken[i], now[i]);
    }
  };
  take(refused_, refusedTaken_, batch.refused);
  take(counts_, countsTaken_, batch.counts);
}

void MetricIntake::discard() {
  for (const CommitBatch& batch : take(Take::All)) forget(batch);
  // Gauges and owners are remembered by their keys.
  users_.beginDay();
  keys_ = std::make_shared<HeldKeys>(keys_->day(), now_.bootSeconds);
  refusedNames_.clear();
}

void MetricIntake::forget(const CommitBatch& batch) {
  for (const CommitBatch::Change& change : batch.changes) {
    if (!change.samples) continue;
    const std::size_t bytes = change.samples->bytes() + sizeof(SampleStream);
    sampleBytes_ -= bytes;
    users_.at(change.user).bytes -= bytes;
    samples_ -= change.samples->count();
  }
}

std::uint64_t MetricIntake::thinned(SampleStream& samples, std::uint32_t user) {
  const std::size_t before = samples.bytes();
  const std::uint64_t gone = samples.thin();
  const std::size_t less = before - std::min(before, samples.bytes());
  sampleBytes_ -= less;
  users_.at(user).bytes -= less;
  samples_ -= gone;
  return gone;
}

bool MetricIntake::thinOldest(std::uint32_t user) {
  std::uint64_t gone = 0;
  for (std::size_t i = 0; i < waiting_.size() && gone == 0; ++i) {
    for (CommitBatch::Change& change : waiting_[i].changes) {
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

void MetricIntake::thin() {
  // Whoever takes most gives first, so that a flood displaces its own samples alone. A margin, so
  // that not every further sample thins again.
  const std::size_t enough = mostBytes() - mostBytes() / 8;
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
    if (most == users_.all().size()) return dropOldest();
    if (!thinOldest(static_cast<std::uint32_t>(most))) exhausted[most] = true;
  }
}

// A store that fails for days leaves the keys of each.
void MetricIntake::dropOldest() {
  while (bytes() > mostBytes() && !waiting_.empty()) {
    count(RecorderCount::ChangesDropped, waiting_.front().changes.size());
    forget(waiting_.front());
    waiting_.pop_front();
  }
}

}  // namespace tally
