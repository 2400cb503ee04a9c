#include "host/store/metrics_store.h"

#include <chrono>
#include <optional>
#include <thread>
#include <utility>
#include <vector>

#include <fmt/core.h>

#include "base/time_text.h"
#include "host/store/store_conversion_day.h"
#include "host/store/store_counters.h"
#include "host/store/store_history.h"
#include "host/store/store_retention.h"
#include "host/store/store_writer.h"
#include "host/store/wear_table.h"

namespace tally {
namespace {

// A checkpoint of millions of new samples takes minutes, longer than other writers wait. It
// releases the lock in between, long enough for writers that try only ten times a second.
constexpr std::chrono::seconds kLongestTurn{2};
constexpr std::chrono::milliseconds kPauseForOthers{150};
// A device that was away for longer counts anew.
constexpr std::int32_t kDaysOfUnseenCounter = 30;

class SqliteMetricsStore final : public MetricsStore {
 public:
  SqliteMetricsStore(StoreFile file, std::shared_ptr<SystemLog> log,
                     std::shared_ptr<const Clock> clock, std::uint64_t maximumBytes,
                     std::shared_ptr<Preferences> preferences)
      : file_(std::move(file)),
        log_(std::move(log)),
        clock_(std::move(clock)),
        maximumBytes_(maximumBytes),
        preferences_(std::move(preferences)) {}

  std::int32_t TBDaysSince1970() override { return dayOfSeconds(clock_->secondsSince1970()); }

  void TBClientCheckpoint() override { report(checkpoint()); }

  void TBClientSetValueForScalarKey(std::string_view key, std::int64_t value) override {
    if (!isStoreKey(key)) {
      report(Error{"metrics store " + file_.text() + ": " + std::string(kStoreKeyRule)});
      return;
    }
    // Kept in memory until the batch ends, so that others need not wait while its values are read.
    batch_.push_back({TBDaysSince1970(), std::string(key), value});
    if (batchDepth_ == 0) writeBatch();
  }
  std::vector<CounterState> counterStates() override {
    auto states = readCounterStates(file_);
    if (!states) report(states.error());
    return states ? *std::move(states) : std::vector<CounterState>();
  }
  void setCounterState(const CounterState& state) override {
    counters_.push_back(state);
    if (batchDepth_ == 0) writeBatch();
  }
  void beginBatch() override { ++batchDepth_; }
  void endBatch() override {
    if (batchDepth_ > 0 && --batchDepth_ == 0) writeBatch();
  }

  void close() override { writer_.reset(); }

  std::unique_ptr<HistoryStore> openHistory() override {
    return openSqliteHistory(file_, [this](const std::string& message) { report(Error{message}); });
  }

  std::vector<WearRow> wearHistory(std::string_view disk) override {
    auto store = openStoreForReading(file_);
    if (store && !*store) return {};
    auto rows = store ? readWear(**store, disk) : Result<std::vector<WearRow>>(store.error());
    if (rows) return std::move(*rows);
    report(rows.error());
    return {};
  }
  void addWear(std::string_view disk, const WearRow& row) override {
    if (row.day < kFirstPlausibleDay) return;
    wears_.push_back({std::string(disk), row});
    if (batchDepth_ == 0) writeBatch();
  }

 private:
  struct DiskWear {
    std::string disk;
    WearRow row;
  };
  struct Scalar {
    std::int32_t day;
    std::string key;
    std::int64_t value;
  };

  void report(const Status& status) {
    if (!status) log_->fault(status.error().message, "{}", status.error().message);
  }

  // The connection stays open, since a run writes more than once. Null: there is no store.
  Result<StoreWriter*> writer(IfMissing ifMissing) {
    if (!writer_) {
      auto opened = StoreWriter::open(file_, ifMissing);
      if (!opened) return opened.error();
      writer_ = std::move(*opened);
    }
    return writer_ ? &*writer_ : nullptr;
  }

  template <class Work>
  static Status transaction(StoreWriter& writer, const Work& work) {
    if (auto begun = writer.begin(); !begun) return begun;
    Status done = work();
    if (done) return writer.commit();
    writer.rollBack();
    return done;
  }

  Status checkpoint() {
    const auto opened = writer(IfMissing::Leave);
    if (!opened) return opened.error();
    if (*opened == nullptr) return Done{};
    if (auto done = foldAndForget(**opened); !done) return done;
    return preferences_ ? convertIfDue(**opened) : Status(Done{});
  }

  Status convertIfDue(StoreWriter& store) {
    const auto packed = store.isPacked();
    if (!packed) return packed.error();
    if (*packed || !conversionIsDue(*preferences_, TBDaysSince1970())) return Done{};
    auto converted =
        store.convertToPackedSchema([this](const std::string& message) { report(Error{message}); });
    if (!converted) return converted;
    log_->write(LogLevel::Default,
                fmt::format("metrics store {}: converted to the present format", file_.text()));
    endConversion(*preferences_);
    return Done{};
  }

  Status foldAndForget(StoreWriter& store) {
    const auto needed = needsCheckpoint(store);
    if (!needed) return needed.error();
    if (!*needed) return Done{};
    for (bool complete = false;;) {
      std::size_t dropped = 0;
      auto done = transaction(store, [&]() -> Status {
        const auto folded = store.foldRecentUntil(std::chrono::steady_clock::now() + kLongestTurn);
        if (!folded) return folded.error();
        complete = *folded;
        return complete ? forgetDays(store, dropped) : Status(Done{});
      });
      if (done && dropped > 0) {
        log_->write(LogLevel::Default,
                    fmt::format("metrics store {}: too large, {} days are removed early",
                                file_.text(), dropped));
      }
      if (!done || complete) return done;
      std::this_thread::sleep_for(kPauseForOthers);
    }
  }

  Result<bool> isTooLarge(StoreWriter& store, std::size_t days) const {
    const auto used = store.usedBytes();
    if (!used) return used.error();
    return days > kMostDaysKept || *used > maximumBytes_;
  }

  // Looks without the lock whether a checkpoint has anything to do.
  Result<bool> needsCheckpoint(StoreWriter& store) {
    const auto recent = store.hasRecent();
    if (!recent || *recent) return recent;
    const auto days = store.days();
    if (!days) return days.error();
    if (firstDayKept(*days, TBDaysSince1970())) return true;
    const auto tooLarge = isTooLarge(store, days->size());
    if (!tooLarge) return tooLarge;
    return *tooLarge && !leastCredibleDays(*days, TBDaysSince1970()).empty();
  }

  Status forgetDays(StoreWriter& store, std::size_t& dropped) {
    auto days = store.days();
    if (!days) return days.error();
    const std::int32_t today = TBDaysSince1970();
    if (const auto first = firstDayKept(*days, today)) {
      if (auto done = store.forgetBefore(*first); !done) return done;
      while (days->back() < *first) days->pop_back();
    }
    for (const std::int32_t day : leastCredibleDays(*days, today)) {
      const auto tooLarge = isTooLarge(store, days->size() - dropped);
      if (!tooLarge) return tooLarge.error();
      if (!*tooLarge) break;
      if (auto done = store.forgetDay(day); !done) return done;
      ++dropped;
    }
    return Done{};
  }

  void writeBatch() {
    const auto scalars = std::exchange(batch_, {});
    const auto counters = std::exchange(counters_, {});
    const auto wears = std::exchange(wears_, {});
    if (scalars.empty() && counters.empty() && wears.empty()) return;
    const auto opened = writer(IfMissing::Create);
    if (!opened) return report(opened.error());
    report(transaction(**opened, [&]() -> Status {
      for (const Scalar& scalar : scalars) {
        auto set = (*opened)->setScalar(scalar.day, scalar.key, scalar.value);
        if (!set) return set;
      }
      for (const CounterState& counter : counters) {
        if (auto set = (*opened)->setCounter(counter); !set) return set;
      }
      if (!counters.empty()) {
        const std::int32_t first = TBDaysSince1970() - kDaysOfUnseenCounter;
        if (auto done = (*opened)->forgetCountersBefore(first); !done) return done;
      }
      for (const DiskWear& wear : wears) {
        if (auto added = (*opened)->addWear(wear.disk, wear.row); !added) return added;
      }
      return Done{};
    }));
  }

  StoreFile file_;
  std::shared_ptr<SystemLog> log_;
  std::shared_ptr<const Clock> clock_;
  std::uint64_t maximumBytes_;
  std::shared_ptr<Preferences> preferences_;
  std::optional<StoreWriter> writer_;
  std::vector<Scalar> batch_;
  std::vector<CounterState> counters_;  // of the batch too
  std::vector<DiskWear> wears_;
  int batchDepth_ = 0;
};

}  // namespace

std::shared_ptr<MetricsStore> makeSqliteMetricsStore(StoreFile file, std::shared_ptr<SystemLog> log,
                                                     std::shared_ptr<const Clock> clock,
                                                     std::uint64_t maximumBytes,
                                                     std::shared_ptr<Preferences> preferences) {
  return std::make_shared<SqliteMetricsStore>(std::move(file), std::move(log), std::move(clock),
                                              maximumBytes, std::move(preferences));
}

}  // namespace tally
