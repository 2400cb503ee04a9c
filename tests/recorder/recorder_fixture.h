// A recorder whose sockets, store and clock are the test's.
#pragma once

#include <gtest/gtest.h>

#include <condition_variable>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "base/time_text.h"
#include "fakes/fake_platform.h"
#include "recorder/recorder.h"

namespace tally {

constexpr std::int32_t kDay = 20700;
constexpr std::int64_t kRoot = 0, kAda = 1001, kBob = 1002;

// What a store holds, as texts: "KEY 5", "KEY 1@10 2@10x3" (a value, its second, its weight).
struct StoredDay {
  std::map<std::string, std::int64_t> scalars;
  std::map<std::string, std::string> samples;
  std::map<std::string, std::uint64_t> weights;
  std::map<std::string, std::int64_t> owners;
};

class FakeRecordingStore final : public RecordingStore {
 public:
  struct State {
    std::map<std::int32_t, StoredDay> days;
    std::vector<std::pair<std::string, UndatedChange>> undated;  // by boot
  };
  State state;
  int commits = 0;
  std::string failure;  // of every commit, unless empty
  bool ownersFail = false;
  bool wantsRunning = false;  // the time that the recorder ran

  Result<std::unique_ptr<RecordingTransaction>> begin() override {
    if (!failure.empty()) return Error{failure};
    return std::unique_ptr<RecordingTransaction>(std::make_unique<Transaction>(*this));
  }
  Result<std::vector<KeyOwner>> owners(std::int32_t day) override {
    std::vector<KeyOwner> found;
    if (ownersFail) return Error{"cannot be read"};
    for (const auto& [key, user] : state.days[day].owners) found.push_back({key, user, false});
    return found;
  }
  Result<std::optional<std::int32_t>> newestDay() override {
    return state.days.empty() ? std::optional<std::int32_t>() : state.days.rbegin()->first;
  }
  Result<std::optional<std::int64_t>> scalar(std::int32_t, std::string_view) override {
    return std::optional<std::int64_t>();
  }
  void releaseMemory() override {}

 private:
  class Transaction final : public RecordingTransaction {
   public:
    explicit Transaction(FakeRecordingStore& store) : store_(store), state_(store.state) {}
    tally::Status apply(std::int32_t day, const RecordedChange& change) override {
      StoredDay& stored = state_.days[day];
      const std::string key(change.key);
      switch (change.kind) {
        case RecordedChange::Kind::Add:
          stored.scalars[key] += change.value;
          break;
        case RecordedChange::Kind::Set:
          stored.scalars[key] = change.value;
          break;
        case RecordedChange::Kind::Move:
          if (!stored.scalars.contains(key)) stored.scalars[key] = former(day, key);
          stored.scalars[key] += change.value;
          break;
        case RecordedChange::Kind::Samples:
          addSamples(stored, key, change.samples);
          break;
      }
      return Done{};
    }
    Result<std::optional<std::int64_t>> owner(std::int32_t day, std::string_view key) override {
      const auto& owners = state_.days[day].owners;
      const auto found = owners.find(std::string(key));
      return found != owners.end() ? std::optional(found->second) : std::nullopt;
    }
    tally::Status setOwner(std::int32_t day, const KeyOwner& owner) override {
      state_.days[day].owners.emplace(owner.key, owner.user);
      return Done{};
    }
    Result<bool> isWanted(OwnMetric, std::int32_t) override { return store_.wantsRunning; }
    tally::Status addUndated(std::string_view boot, std::int64_t seconds,
                             const RecordedChange& change) override {
      const auto copied = [](auto span) { return std::vector(span.begin(), span.end()); };
      state_.undated.push_back(
          {std::string(boot),
           {change.kind, std::string(change.key), change.value, copied(change.samples.values),
            copied(change.samples.offsets), copied(change.samples.weights), change.user, seconds}});
      return Done{};
    }
    Result<std::vector<UndatedChange>> takeUndated(std::string_view boot, std::size_t) override {
      std::vector<UndatedChange> taken;
      std::erase_if(state_.undated, [&](auto& row) {
        if (row.first != boot) return false;
        taken.push_back(std::move(row.second));
        return true;
      });
      return taken;
    }
    Result<std::uint64_t> forgetUndated(std::optional<std::int32_t>) override { return 0; }
    tally::Status commit() override {
      store_.state = state_;
      ++store_.commits;
      return Done{};
    }

   private:
    std::int64_t former(std::int32_t day, const std::string& key) {
      const auto& scalars = state_.days[day - 1].scalars;
      return scalars.contains(key) ? scalars.at(key) : 0;
    }
    static void addSamples(StoredDay& stored, const std::string& key, const SampleColumns& all) {
      for (std::size_t i = 0; i < all.values.size(); ++i) {
        const std::uint32_t weight = all.weights.empty() ? 1 : all.weights[i];
        stored.samples[key] += fmt::format("{}{}@{}", stored.samples[key].empty() ? "" : " ",
                                           all.values[i], all.offsets[i]);
        if (weight != 1) stored.samples[key] += fmt::format("x{}", weight);
        stored.weights[key] += weight;
      }
    }
    FakeRecordingStore& store_;
    State state_;
  };
};

class FakeIngress final : public Ingress {
 public:
  bool stopped = false, activated = false;
  std::map<ControlRequest, std::string> answers;
  tally::Status run(IngressHandler&) override { return Done{}; }
  void stop() override { stopped = true; }
  void stopReading() override {}
  void wake() override {
    const std::lock_guard guard(mutex_);
    ++wakes_;
    woken_.notify_all();
  }
  void answer(ControlRequest request, std::string_view text) override { answers[request] = text; }
  bool hasConnections() const override { return false; }
  bool isActivated() const override { return activated; }
  void awaitWake(int count) {
    std::unique_lock guard(mutex_);
    woken_.wait(guard, [&] { return wakes_ >= count; });
  }

 private:
  std::mutex mutex_;
  std::condition_variable woken_;
  int wakes_ = 0;
};

class RecorderTest : public ::testing::Test {
 protected:
  void start() {
    recorder = std::make_unique<Recorder>(
        RecorderParts{.store = store,
                      .ingress = ingress,
                      .log = *log,
                      .bootId = "boot",
                      .readSettings = [this] { return settings; },
                      .clockIsSynchronised = [this] { return synchronised; },
                      .onCommitted = [] {}});
  }
  // A round in which the user sends the lines, `seconds` after the one before.
  void send(std::int64_t user, std::string_view lines, double seconds = 0) {
    if (!recorder) start();
    boot += static_cast<std::int64_t>(seconds * 1e9);
    wall += seconds;
    recorder->beginRound(boot, wall);
    if (!lines.empty()) recorder->onLines({user}, lines);
    next = recorder->endRound();
  }
  // Has everything committed, as the daily run does.
  std::string commit() {
    const ControlRequest request = ++lastRequest;
    recorder->beginRound(boot, wall);
    recorder->onControl(request, "commit");
    next = recorder->endRound();
    while (!ingress.answers.contains(request)) settle();
    return ingress.answers[request];
  }
  // Rounds until no commit is under way.
  void settle() {
    do {
      if (recorder->isCommitting()) ingress.awaitWake(++commitsAwaited);
      send(kRoot, "");
    } while (recorder->isCommitting());
  }
  std::uint64_t refused(std::string_view key, std::int32_t day = kDay) {
    const auto& scalars = store.state.days[day].scalars;
    const auto found = scalars.find("vellum.tallyd.refused." + std::string(key));
    return found == scalars.end() ? 0 : static_cast<std::uint64_t>(found->second);
  }

  FakeRecordingStore store;
  FakeIngress ingress;
  std::shared_ptr<fakes::FakeSystemLog> log = std::make_shared<fakes::FakeSystemLog>();
  RecorderSettings settings;
  bool synchronised = false;
  std::unique_ptr<Recorder> recorder;
  std::int64_t boot = 1'000'000'000'000;
  double wall = kDay * 86400.0 + 36000;
  std::optional<std::int64_t> next;
  ControlRequest lastRequest = 0;
  int commitsAwaited = 0;
};

}  // namespace tally
