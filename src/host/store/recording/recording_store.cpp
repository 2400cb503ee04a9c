#include "host/store/recording/recording_store.h"

#include <limits>
#include <utility>

#include "host/store/recording/undated_table.h"
#include "host/store/samples/arrival_table.h"
#include "host/store/store_days.h"
#include "host/store/store_rows.h"

namespace tally {
namespace {

// A commit writes to a few pages; the rest of the memory is of use to the recorder's callers.
constexpr std::size_t kMemory = 384u << 10;

// An open store, and what was prepared on it.
struct Connection {
  Connection(Database opened, std::optional<FileIdentity> file)
      : database(std::move(opened)), identity(file) {}

  Database database;
  std::optional<FileIdentity> identity;
  std::optional<Statement> getScalar, setScalar, getOwner, setOwner;

  // Prepares the statement at its first use.
  Result<Statement*> prepared(std::optional<Statement>& statement, std::string_view text) {
    if (!statement) {
      auto made = database.prepare(text);
      if (!made) return made.error();
      statement = std::move(*made);
    }
    return &*statement;
  }

  // The value of a day's scalar; empty if it has none, or a damaged one.
  Result<std::optional<std::int64_t>> scalar(std::int32_t day, std::string_view key) {
    const auto get = prepared(getScalar, "SELECT value FROM scalars WHERE day = ?1 AND key = ?2");
    if (!get) return get.error();
    return integerOf(**get, day, key);
  }

  // What a query of a day and a key answers.
  Result<std::optional<std::int64_t>> integerOf(Statement& get, std::int32_t day,
                                                std::string_view key) {
    const Step step = get.bind(1, std::int64_t{day}).bind(2, key).step();
    std::optional<std::int64_t> value;
    if (step == Step::Row && get.type(0) == ColumnType::Integer) value = get.integer(0);
    Status failed = step == Step::Failed ? Status(database.error()) : Status(Done{});
    get.reset();
    if (!failed) return failed.error();
    return value;
  }
};

std::int64_t saturatedSum(std::int64_t a, std::int64_t b) {
  using Limits = std::numeric_limits<std::int64_t>;
  std::int64_t sum = 0;
  if (!__builtin_add_overflow(a, b, &sum)) return sum;
  return b < 0 ? Limits::min() : Limits::max();
}

class SqliteTransaction final : public RecordingTransaction {
 public:
  explicit SqliteTransaction(std::shared_ptr<Connection> connection)
      : connection_(std::move(connection)), database_(connection_->database) {}
  ~SqliteTransaction() override {
    if (!committed_) (void)database_.execute("ROLLBACK");
  }

  Status apply(std::int32_t day, const RecordedChange& change) override {
    if (!isStoreKey(change.key)) return database_.error(kStoreKeyRule);
    if (change.kind == RecordedChange::Kind::Samples) {
      return addSamples(day, change.key, change.samples);
    }
    std::int64_t value = change.value;
    if (change.kind != RecordedChange::Kind::Set) {
      auto former = connection_->scalar(day, change.key);
      if (former && !*former && change.kind == RecordedChange::Kind::Move) {
        former = connection_->scalar(day - 1, change.key);
      }
      if (!former) return former.error();
      value = saturatedSum(former->value_or(0), value);
    }
    const auto set = connection_->prepared(connection_->setScalar,
                                           "INSERT OR REPLACE INTO scalars VALUES (?1, ?2, ?3)");
    if (!set) return set.error();
    return done((*set)->bind(1, std::int64_t{day}).bind(2, change.key).bind(3, value).run());
  }

  Result<std::optional<std::int64_t>> owner(std::int32_t day, std::string_view key) override {
    if (auto made = make(kOwnersTable, hasOwners_); !made) return made.error();
    const auto get = connection_->prepared(connection_->getOwner,
                                           "SELECT user FROM owners WHERE day = ?1 AND key = ?2");
    if (!get) return get.error();
    return connection_->integerOf(**get, day, key);
  }

  Status setOwner(std::int32_t day, const KeyOwner& owner) override {
    if (!isStoreKey(owner.key)) return database_.error(kStoreKeyRule);
    if (auto made = make(kOwnersTable, hasOwners_); !made) return made;
    const auto set = connection_->prepared(connection_->setOwner,
                                           "INSERT OR IGNORE INTO owners VALUES (?1, ?2, ?3, ?4)");
    if (!set) return set.error();
    return done((*set)
                    ->bind(1, std::int64_t{day})
                    .bind(2, owner.key)
                    .bind(3, owner.user)
                    .bind(4, std::int64_t{owner.distribution})
                    .run());
  }

  Result<bool> isWanted(OwnMetric metric, std::int32_t today) override {
    const auto exists = hasTable(database_, kCountersTable);
    if (!exists) return exists.error();
    if (!*exists) return false;
    auto get = database_.prepare("SELECT day FROM counters WHERE key = ?1");
    if (!get) return get.error();
    const Step step = get->bind(1, rowOf(metric).key).step();
    if (step == Step::Failed) return database_.error();
    return step == Step::Row && get->type(0) == ColumnType::Integer &&
           isStillWanted(get->integer(0), today);
  }

  Status addUndated(std::string_view boot, std::int64_t secondsSinceBoot,
                    const RecordedChange& change) override {
    if (!isStoreKey(change.key) || !isStoreKey(boot)) return database_.error(kStoreKeyRule);
    return addUndatedChange(database_, boot, secondsSinceBoot, change);
  }
  Result<std::vector<UndatedChange>> takeUndated(std::string_view boot, std::size_t most) override {
    return takeUndatedChanges(database_, boot, most);
  }
  Result<std::uint64_t> forgetUndated(std::optional<std::int32_t> today) override {
    return forgetUndatedChanges(database_, today);
  }

  Status commit() override {
    auto committed = database_.execute("COMMIT");
    committed_ = static_cast<bool>(committed);
    return committed;
  }

 private:
  Status done(bool succeeded) const { return succeeded ? Status(Done{}) : database_.error(); }

  // A transaction that is undone takes the tables with it that it made.
  Status make(std::string_view table, bool& exists) {
    if (exists) return Done{};
    auto made = makeOptionalTable(database_, table);
    exists = static_cast<bool>(made);
    return made;
  }

  Status addSamples(std::int32_t day, std::string_view key, const SampleColumns& samples) {
    if (!arrivals_) {
      auto opened = ArrivalTable::open(database_);
      if (!opened) return opened.error();
      arrivals_ = std::move(*opened);
    }
    return arrivals_->add(day, key, samples);
  }

  std::shared_ptr<Connection> connection_;
  Database& database_;
  std::optional<ArrivalTable> arrivals_;
  bool committed_ = false, hasOwners_ = false;
};

class SqliteRecordingStore final : public RecordingStore {
 public:
  explicit SqliteRecordingStore(StoreFile file) : file_(std::move(file)) {}

  Result<std::unique_ptr<RecordingTransaction>> begin() override {
    // Whoever held the lock may have removed the store meanwhile.
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
      const auto store = open(IfMissing::Create);
      if (!store) return store.error();
      if (auto begun = (*store)->database.execute("BEGIN IMMEDIATE"); !begun) return begun.error();
      auto transaction = std::make_unique<SqliteTransaction>(*store);
      if (isCurrent(**store)) return std::unique_ptr<RecordingTransaction>(std::move(transaction));
    }
    return changing();
  }

  Result<std::vector<KeyOwner>> owners(std::int32_t day) override {
    std::vector<KeyOwner> found;
    const auto store = open(IfMissing::Leave);
    if (!store) return store.error();
    if (*store == nullptr) return found;
    Database& database = (*store)->database;
    const auto exists = hasTable(database, kOwnersTable);
    if (!exists) return exists.error();
    if (!*exists) return found;
    auto rows = database.prepare(
        "SELECT day, key, user, distribution FROM owners WHERE day = ?1 ORDER BY key");
    if (!rows) return rows.error();
    rows->bind(1, std::int64_t{day});
    RowOrder order;
    Step step = Step::Done;
    while ((step = rows->step()) == Step::Row) {
      const std::string_view key = rows->text(1);
      if (!order.follows(*rows, day, key)) return damagedTree(database);
      if (!isStoreKey(key) || rows->type(2) != ColumnType::Integer) continue;
      found.push_back({std::string(key), rows->integer(2), rows->integer(3) != 0});
    }
    if (step == Step::Failed) return database.error();
    return found;
  }

  Result<std::optional<std::int32_t>> newestDay() override {
    const auto store = open(IfMissing::Leave);
    if (!store) return store.error();
    if (*store == nullptr) return std::optional<std::int32_t>();
    const auto days = daysOfStore((*store)->database, 1);
    if (!days) return days.error();
    return days->empty() ? std::optional<std::int32_t>() : days->front();
  }

  Result<std::optional<std::int64_t>> scalar(std::int32_t day, std::string_view key) override {
    const auto store = open(IfMissing::Leave);
    if (!store) return store.error();
    if (*store == nullptr) return std::optional<std::int64_t>();
    return (*store)->scalar(day, key);
  }

  void releaseMemory() override {
    if (connection_) connection_->database.releaseMemory();
  }

 private:
  static constexpr int kAttempts = 3;

  Error changing() const {
    return {"metrics store " + file_.text() + ": it was replaced while it was being opened"};
  }

  std::optional<FileIdentity> identity() const { return file_.directory.identity(file_.name); }

  bool isCurrent(const Connection& connection) const {
    const auto now = identity();
    return now && connection.identity && now->device == connection.identity->device &&
           now->inode == connection.identity->inode && !connection.database.wasReplaced();
  }

  // The connection to the present store. Null: there is none, and none is to be made.
  Result<std::shared_ptr<Connection>> open(IfMissing ifMissing) {
    if (connection_ && isCurrent(*connection_)) return connection_;
    // As its last connection, this one would remove the log of the store that is there now.
    if (connection_) connection_->database.foldLogOnClose(false);
    connection_.reset();
    for (int attempt = 0; attempt < kAttempts; ++attempt) {
      const auto before = identity();
      auto opened = openStoreForWriting(file_, ifMissing);
      if (!opened) return opened.error();
      if (!*opened) return std::shared_ptr<Connection>();
      auto connection = std::make_shared<Connection>(std::move(**opened), before);
      if (!before) connection->identity = identity();
      if (isCurrent(*connection)) {
        auto limited = connection->database.limitMemory(kMemory);
        if (!limited) return limited.error();
        return connection_ = std::move(connection);
      }
      connection->database.foldLogOnClose(false);
    }
    return changing();
  }

  StoreFile file_;
  std::shared_ptr<Connection> connection_;
};

}  // namespace

std::shared_ptr<RecordingStore> makeSqliteRecordingStore(StoreFile file) {
  return std::make_shared<SqliteRecordingStore>(std::move(file));
}

}  // namespace tally
