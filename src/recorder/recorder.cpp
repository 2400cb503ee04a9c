#include "recorder/recorder.h"

#include <algorithm>
#include <cmath>
#include <cstring>
#include <utility>

#include "base/time_text.h"

namespace tally {
namespace {

constexpr std::int64_t kNanoseconds = 1'000'000'000;
// Rates below are taken as this: a weight stays a number that a day can have.
constexpr double kLeastRate = 1e-6;
// What the program takes beside what it holds: its code's data, the store's buffers, the stack of
// the commit.
constexpr std::size_t kMemoryOfProgram = 5 << 20;

}  // namespace

Recorder::Recorder(RecorderParts parts)
    : parts_(std::move(parts)),
      rules_(parts_.readSettings()),
      clock_(parts_.clockIsSynchronised),
      committer_(
          parts_.store, parts_.bootId, [this] { parts_.ingress.wake(); }, parts_.afterCommit) {}

std::size_t Recorder::memoryForData() const {
  return static_cast<std::size_t>(rules_.settings().number(RecorderNumber::MemoryLimit)) -
         kMemoryOfProgram;
}

void Recorder::beginRound(std::int64_t bootNanoseconds, double secondsSince1970) {
  bootNanoseconds_ = bootNanoseconds;
  secondsSince1970_ = secondsSince1970;
  if (!keys_) {
    startedAt_ = lastLineAt_ = bootNanoseconds;
    const auto newest = parts_.store.newestDay();
    if (newest) {
      clock_.setNewestDay(*newest);
    } else {
      parts_.log.fault("recorder: store", "{}", newest.error().message);
    }
  }
  now_ = clock_.at(bootNanoseconds, secondsSince1970);
  if (!keys_ || keys_->day() != now_.day) beginDay();
}

void Recorder::beginDay() {
  // After a day that came to its end nobody else has recorded in the next one yet.
  const bool mayHaveOwners = !keys_ || !keys_->day() || (now_.day && *keys_->day() > *now_.day);
  if (keys_) {
    CommitBatch batch = takeBatch(/*durableAlone=*/false, /*atEnd=*/true);
    if (!batch.changes.empty()) ended_.push_back(std::move(batch));
  }
  if (now_.day) {
    // What was recorded before the clock was set, in memory and in the store, is dated now.
    dateUndated_ = true;
    for (CommitBatch& batch : ended_) {
      if (!batch.day && !batch.originOnClock) {
        batch.originOnClock = now_.wallMinusBoot + static_cast<double>(batch.origin);
      }
    }
  }
  users_.beginDay();
  keyBytes_ = 0;  // the former keys go with their last batch
  keys_ = std::make_shared<HeldKeys>(now_.day, now_.bootSeconds);
  if (now_.day && mayHaveOwners) loadOwners();
}

void Recorder::loadOwners() {
  const auto owners =
      committer_.withStore([&](RecordingStore& store) { return store.owners(*now_.day); });
  if (!owners) return parts_.log.fault("recorder: store", "{}", owners.error().message);
  for (const KeyOwner& owner : *owners) {
    if (keys_->findKey(owner.key) != HeldKeys::kNone) continue;
    const std::uint32_t user = users_.indexOf({owner.user}, rules_.settings());
    std::size_t grown = 0;
    HeldKey& key = keys_->at(keys_->add(owner.key, owner.key, grown));
    key.user = user;
    key.type = owner.distribution ? HeldType::Distribution : HeldType::None;
    key.durable = rules_.isDurable(owner.key);
    ++users_.at(user).keysToday;
    keyBytes_ += grown;
  }
}

void Recorder::onLines(Sender sender, std::string_view lines) {
  lastLineAt_ = bootNanoseconds_;
  const std::uint32_t user = users_.indexOf(sender, rules_.settings());
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
    if (const auto refused = parseMetricLine(line, metric, values_)) {
      refuse(user, *refused);
    } else {
      record(user, metric);
    }
  }
}

void Recorder::record(std::uint32_t user, const MetricLine& metric) {
  if (!users_.admit(users_.at(user), values_.size(), bootNanoseconds_, rules_.settings())) {
    return refuse(user, Refusal::MetricsPerSecond, values_.size());
  }
  const std::uint32_t index = keyFor(user, metric);
  if (index == HeldKeys::kNone) return;
  HeldKey& key = keys_->at(index);
  if (key.user != user && !key.anyUser) return refuse(user, Refusal::Owner, values_.size());
  if (metric.skippedSections > 0) count(RecorderCount::SectionsSkipped, metric.skippedSections);
  keys_->markDirty(index);
  addValues(key, user, metric);
  durableWaits_ = durableWaits_ || key.durable;
  if (!heldSince_) heldSince_ = bootNanoseconds_;
  users_.at(user).metrics += values_.size();
  metrics_ += values_.size();
}

std::uint32_t Recorder::keyFor(std::uint32_t user, const MetricLine& metric) {
  const std::string_view identity = rules_.identityOf(metric.name, metric.tags, identity_);
  const std::uint32_t index = keys_->find(identity);
  if (index != HeldKeys::kNone) return index;
  if (const auto loss = clientLossOf(metric.name)) {
    double lost = 0;
    for (const MetricValue& value : values_) lost += std::max(value.number, 0.0) / metric.rate;
    constexpr double kMostBelieved = 1e15;
    count(*loss, static_cast<std::uint64_t>(std::min(lost, kMostBelieved)));
    return HeldKeys::kNone;
  }
  return addKey(user, metric, identity);
}

std::uint32_t Recorder::addKey(std::uint32_t user, const MetricLine& metric,
                               std::string_view identity) {
  const auto refused = [&](Refusal refusal) {
    refuse(user, refusal, values_.size());
    return HeldKeys::kNone;
  };
  if (!isRecordableName(identity)) return refused(Refusal::Name);
  const std::string key = rules_.keyOf(metric.name, identity);
  if (!isRecordableName(key)) return refused(Refusal::Name);
  std::size_t grown = 0;
  std::uint32_t index = rules_.isIdentity() ? HeldKeys::kNone : keys_->findKey(key);
  if (index != HeldKeys::kNone) {
    keys_->addIdentity(identity, index, grown);
    keyBytes_ += grown;
    return index;
  }
  RecordingUser& recording = users_.at(user);
  const RecorderSettings& settings = rules_.settings();
  const auto limit = [&](RecorderNumber which) {
    return static_cast<std::uint64_t>(settings.number(which));
  };
  if (!rules_.mayRecord(recording.sender.user, key)) return refused(Refusal::Permission);
  if (recording.keysToday >= limit(RecorderNumber::KeysOfUser)) return refused(Refusal::KeysOfUser);
  if (keys_->size() >= limit(RecorderNumber::KeysOfDay)) return refused(Refusal::KeysOfDay);
  if (bytes() >= memoryForData()) return refused(Refusal::Memory);
  index = keys_->add(identity, key, grown);
  HeldKey& held = keys_->at(index);
  held.user = user;
  held.isNew = true;
  held.durable = rules_.isDurable(key);
  ++recording.keysToday;
  keyBytes_ += grown;
  return index;
}

void Recorder::noteType(HeldKey& key, MetricType type) {
  const HeldType now = type == MetricType::Counter ? HeldType::Counter
                       : type == MetricType::Gauge ? HeldType::Gauge
                                                   : HeldType::Distribution;
  if (key.type == now) return;
  // Of a key that an earlier process recorded only this is known: it is not a distribution.
  const bool first = key.type == HeldType::None && (key.isNew || now != HeldType::Distribution);
  key.type = now;
  if (first || key.twoTypes) return;
  key.twoTypes = true;
  count(RecorderCount::KeysOfTwoTypes);
  parts_.log.repeated(LogLevel::Default, "recorder: keys of two types",
                      "the key {} is recorded as two types", key.key);
}

void Recorder::addValues(HeldKey& key, std::uint32_t user, const MetricLine& metric) {
  noteType(key, metric.type);
  double rate = metric.rate;
  if (rate < kLeastRate) {
    rate = kLeastRate;
    count(RecorderCount::RatesBounded);
  }
  for (const MetricValue& value : values_) {
    switch (metric.type) {
      case MetricType::Counter:
        key.scalar.add(value.number / rate);
        break;
      case MetricType::Gauge:
        if (value.isSigned) {
          key.scalar.move(value.number);
        } else {
          key.scalar.set(value.number);
        }
        break;
      case MetricType::Duration:
      case MetricType::Sample:
        addSample(key, user, value.number, rate);
        break;
    }
  }
}

void Recorder::addSample(HeldKey& key, std::uint32_t user, double value, double rate) {
  std::uint32_t weight = 1;
  if (rate != 1) {
    // A weight is whole; what it leaves is added to the next one, so that counts are right.
    const double exact = 1 / rate + static_cast<double>(key.weightLeft);
    weight = static_cast<std::uint32_t>(std::max(std::round(exact), 1.0));
    key.weightLeft = static_cast<float>(exact - weight);
  }
  if (bytes() > memoryForData()) {
    thin();
    // Everything may be in the commit that is under way.
    if (bytes() > memoryForData()) return refuse(user, Refusal::Memory);
  }
  if (!key.samples) {
    key.samples = std::make_unique<SampleStream>();
    growSamples(user, sizeof(SampleStream));
  }
  const std::int64_t offset =
      now_.day ? static_cast<std::int64_t>(secondsSince1970_ -
                                           static_cast<double>(*now_.day) * kSecondsPerDay)
               : now_.bootSeconds - keys_->origin();
  growSamples(user,
              key.samples->add(value, static_cast<std::uint32_t>(std::max<std::int64_t>(offset, 0)),
                               weight));
  ++samplesHeld_;
}

void Recorder::refuse(std::uint32_t user, Refusal refusal, std::uint64_t count) {
  const auto which = static_cast<std::size_t>(refusal);
  refused_[which] += count;
  users_.at(user).refused[which] += count;
  if (!heldSince_) heldSince_ = bootNanoseconds_;
}

void Recorder::count(RecorderCount which, std::uint64_t amount) {
  counts_[static_cast<std::size_t>(which)] += amount;
  if (!heldSince_) heldSince_ = bootNanoseconds_;
}

void Recorder::growSamples(std::uint32_t user, std::size_t bytes) {
  sampleBytes_ += bytes;
  users_.at(user).bytes += bytes;
}

void Recorder::onLoss(IngressLoss loss, Sender sender, std::uint64_t count) {
  static constexpr Refusal kOfLoss[] = {Refusal::Truncated, Refusal::LongLine,
                                        Refusal::SocketOverflow, Refusal::NoCredentials,
                                        Refusal::Connections};
  refuse(users_.indexOf(sender, rules_.settings()), kOfLoss[static_cast<std::size_t>(loss)], count);
}

std::size_t Recorder::streamQuota(Sender sender) {
  constexpr std::size_t kMost = 64 << 10;
  constexpr double kBytesOfMetric = 2;  // the shortest, in a line of many values
  constexpr double kLeast = 64;         // metrics, so that reading is worth it
  RecordingUser& user = users_.at(users_.indexOf(sender, rules_.settings()));
  (void)users_.admit(user, 0, bootNanoseconds_, rules_.settings());
  if (user.allowance < kLeast) return 0;
  return static_cast<std::size_t>(std::min(user.allowance * kBytesOfMetric, double{kMost}));
}

void Recorder::onReload() {
  // The day's keys stay as they are; the rules decide on new ones.
  rules_ = KeyRules(parts_.readSettings());
  parts_.log.write(LogLevel::Default, "settings read again");
}

}  // namespace tally
