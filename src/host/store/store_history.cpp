#include "host/store/store_history.h"

#include <utility>
#include <vector>

#include "host/store/samples/sample_source.h"
#include "host/store/store_rows.h"
#include "host/store/store_schema.h"

namespace tally {
namespace {

class SqliteHistory final : public HistoryStore {
 public:
  SqliteHistory(Database database, StoreFaultHandler onFault, DamagedRowHandler onDamaged)
      : database_(std::move(database)),
        onFault_(std::move(onFault)),
        losses_{0, true, std::move(onDamaged)} {}

  void enumerateScalars(std::string_view keyPrefix, std::int32_t minimumDay,
                        std::int32_t maximumDay, const ScalarHandler& handler) override {
    const StoreRange range(keyPrefix, minimumDay, maximumDay);
    StoreFaults faults(database_, onFault_, &losses_);
    auto rows = database_.prepare("SELECT day, key, value FROM scalars" +
                                  std::string(StoreRange::kCondition) + " ORDER BY day, key");
    if (!rows) return faults.fail(rows.error());
    range.bindTo(*rows);
    bool stop = false;
    Step step = Step::Done;
    RowOrder order;
    while (!stop && (step = rows->step()) == Step::Row) {
      const std::int64_t day = rows->integer(0);
      const std::string_view key = rows->text(1);
      if (!order.follows(*rows, day, key)) return faults.fail(damagedTree(database_));
      if (!isStoreKey(key) || rows->type(2) != ColumnType::Integer) {
        faults.addDamaged(key, day);
        continue;
      }
      handler(key, static_cast<std::int32_t>(day), rows->integer(2), stop);
    }
    if (step == Step::Failed) faults.fail(database_.error());
  }

  void enumerateDistributions(std::string_view keyPrefix, std::int32_t minimumDay,
                              std::int32_t maximumDay, const DistributionHandler& handler,
                              const KeyFilter& wanted) override {
    const StoreRange range(keyPrefix, minimumDay, maximumDay);
    StoreFaults faults(database_, onFault_, &losses_);
    enumerateSources(openSampleSources(database_, faults, range, wanted), handler);
  }

  std::optional<std::uint64_t> damagedRows() override {
    return losses_.isComplete ? std::optional(losses_.damagedRows) : std::nullopt;
  }

  bool hasWeights() override {
    constexpr std::string_view kWeighted[] = {kPackedTable, kSeriesTable, kArrivalsTable};
    const auto tables = presentTables(database_, kWeighted);
    if (!tables) return false;  // the reading's to report
    for (const std::string_view table : *tables) {
      const auto found = database_.integer("SELECT EXISTS(SELECT 1 FROM " + std::string(table) +
                                           " WHERE weight <> samples)");
      if (found && *found != 0) return true;
    }
    return false;
  }

 private:
  Database database_;
  StoreFaultHandler onFault_;
  StoreLosses losses_;
};

class EmptyHistory final : public HistoryStore {
 public:
  void enumerateScalars(std::string_view, std::int32_t, std::int32_t,
                        const ScalarHandler&) override {}
  void enumerateDistributions(std::string_view, std::int32_t, std::int32_t,
                              const DistributionHandler&, const KeyFilter&) override {}
};

}  // namespace

std::unique_ptr<HistoryStore> openSqliteHistory(const StoreFile& file, StoreFaultHandler onFault,
                                                DamagedRowHandler onDamaged) {
  auto store = openStoreForReading(file);
  if (!store) onFault(store.error().message);
  if (!store || !*store) return std::make_unique<EmptyHistory>();
  return std::make_unique<SqliteHistory>(std::move(**store), std::move(onFault),
                                         std::move(onDamaged));
}

void listStoreKeys(const StoreFile& file, const std::function<void(const StoreKey&)>& handler,
                   const StoreFaultHandler& onFault) {
  auto store = openStoreForReading(file);
  if (!store) return onFault(store.error().message);
  if (!*store) return;
  Database& database = **store;
  StoreFaults faults(database, onFault);
  const auto tables = presentTables(database, kSampleTables);
  if (!tables) return faults.fail(tables.error());
  std::string samples;
  for (const std::string_view table : *tables) {
    samples += (samples.empty() ? "SELECT day, key, samples FROM "
                                : " UNION ALL SELECT day, key, samples FROM ") +
               std::string(table);
  }
  const struct {
    StoreKey::Kind kind;
    std::string query;
  } kQueries[] = {
      {StoreKey::Kind::Scalar,
       "SELECT key, min(day), max(day), count(*), 0 FROM scalars GROUP BY key ORDER BY key"},
      {StoreKey::Kind::Distribution,
       "SELECT key, min(day), max(day), count(DISTINCT day), sum(samples) FROM "
       "(" +
           samples + ") GROUP BY key ORDER BY key"},
  };
  for (const auto& [kind, query] : kQueries) {
    auto rows = database.prepare(query);
    if (!rows) return faults.fail(rows.error());
    Step step = Step::Done;
    while ((step = rows->step()) == Step::Row) {
      const std::string_view key = rows->text(0);
      if (!isStoreKey(key)) {
        faults.addDamaged(key, rows->integer(1));
        continue;
      }
      handler({kind, key, rows->integer(1), rows->integer(2), rows->integer(3), rows->integer(4)});
    }
    if (step == Step::Failed) return faults.fail(database.error());
  }
}

}  // namespace tally
