#include "host/store/store_schema.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <iterator>

#include "base/utf8.h"
#include "host/store/store_aside.h"
#include "platform/metrics_store.h"

namespace tally {
namespace {

constexpr std::int64_t kApplicationId = 0x54424453;  // "TBDS"
constexpr std::int64_t kSchemaVersion = kPackedSchema;
constexpr std::size_t kLongestKey = 512;

// Days and keys are in the order of every pass, so a pass is one walk along the tree. New samples
// go to a small table of their own, which is cheap to write; a checkpoint puts them in order.
constexpr std::string_view kRawColumns = R"sql((
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL, samples INTEGER NOT NULL,
  sample_values BLOB NOT NULL, sample_offsets BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID)sql";
struct TableDefinition {
  std::string_view name, columns;
  // The versions of the schema that have it.
  std::int64_t first = 1, last = kSchemaVersion;

  bool isIn(std::int64_t version) const { return first <= version && version <= last; }
  std::string text() const { return "CREATE TABLE " + std::string(name) + std::string(columns); }
};
constexpr TableDefinition kTables[] = {
    {"scalars", R"sql((
  day INTEGER NOT NULL, key TEXT NOT NULL, value INTEGER NOT NULL,
  PRIMARY KEY(day, key)) WITHOUT ROWID)sql"},
    {kChunksTable, kRawColumns, kRawSchema, kRawSchema},
    {kRecentTable, kRawColumns, kRawSchema, kRawSchema},
    {kSeriesTable, R"sql((
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL,
  samples INTEGER NOT NULL, weight INTEGER NOT NULL,
  sample_values BLOB NOT NULL, sample_weights BLOB NOT NULL, sample_offsets BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID)sql",
     kPackedSchema},
};
// Tables that are made when they are first written.
constexpr TableDefinition kOptionalTables[] = {
    {kCountersTable, R"sql((
  key TEXT NOT NULL PRIMARY KEY, epoch TEXT NOT NULL, last INTEGER NOT NULL, sum INTEGER NOT NULL,
  day INTEGER NOT NULL, amount INTEGER) WITHOUT ROWID)sql"},
    {kWearTable, R"sql((
  disk TEXT NOT NULL, day INTEGER NOT NULL, least INTEGER NOT NULL, most INTEGER,
  host_bytes INTEGER, flash_bytes INTEGER,
  PRIMARY KEY(disk, day)) WITHOUT ROWID)sql"},
    // In the order of arrival: a commit of many keys fills a few pages that follow each other. In
    // the order of keys, each would be written to a page of its own.
    {kArrivalsTable, R"sql((
  number INTEGER PRIMARY KEY, day INTEGER NOT NULL, key TEXT NOT NULL,
  samples INTEGER NOT NULL, weight INTEGER NOT NULL, data BLOB NOT NULL))sql"},
    {kPackedTable, R"sql((
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL,
  samples INTEGER NOT NULL, weight INTEGER NOT NULL, data BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID)sql",
     kRawSchema, kRawSchema},
    {kOwnersTable, R"sql((
  day INTEGER NOT NULL, key TEXT NOT NULL, user INTEGER NOT NULL, distribution INTEGER NOT NULL,
  PRIMARY KEY(day, key)) WITHOUT ROWID)sql"},
    {kUndatedTable, R"sql((
  number INTEGER PRIMARY KEY, boot TEXT NOT NULL, seconds INTEGER NOT NULL, kind INTEGER NOT NULL,
  key TEXT NOT NULL, value INTEGER NOT NULL, data BLOB, user INTEGER NOT NULL,
  first_day INTEGER))sql"},
};
// Tables that SQLite itself adds for its query planner on request. They are harmless.
constexpr TableDefinition kStatistics[] = {
    {"sqlite_stat1", "(tbl,idx,stat)"},
    {"sqlite_stat4", "(tbl,idx,neq,nlt,ndlt,sample)"},
};

// Anything else could run when a table is read or written: a view in a table's place, a trigger, a
// virtual table, a column that is computed. REQUIRES: a transaction.
Status checkTables(Database& database, std::int64_t version) {
  auto rows = database.prepare("SELECT type, name, tbl_name, sql FROM sqlite_schema");
  if (!rows) return rows.error();
  std::size_t ours = 0, others = 0;
  Step step = Step::Done;
  while ((step = rows->step()) == Step::Row) {
    const auto isRow = [&](const TableDefinition& table) {
      return table.isIn(version) && rows->text(0) == "table" && rows->text(1) == table.name &&
             rows->text(2) == table.name && rows->text(3) == table.text();
    };
    if (std::ranges::any_of(kTables, isRow)) {
      ++ours;
    } else if (!std::ranges::any_of(kStatistics, isRow) &&
               !std::ranges::any_of(kOptionalTables, isRow)) {
      ++others;
    }
  }
  if (step == Step::Failed) return database.error();
  const auto expected = std::ranges::count_if(
      kTables, [&](const TableDefinition& table) { return table.isIn(version); });
  if (ours == static_cast<std::size_t>(expected) && others == 0) return Done{};
  return database.error("its tables are not those of a metrics store");
}

// The directory that holds the store; empty when there is no store yet.
Result<std::optional<Directory>> directoryOf(const StoreFile& file) {
  auto directory = file.directory.open();
  if (!directory && directory.error().systemError == ENOENT) return std::optional<Directory>();
  if (!directory) {
    return Error{"metrics store " + file.text() + ": " + directory.error().message,
                 directory.error().systemError};
  }
  struct stat status {};
  if (::fstatat(directory->descriptor(), file.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) == 0) {
    return std::optional(std::move(*directory));
  }
  if (errno == ENOENT) return std::optional<Directory>();
  return Error{"metrics store " + file.text() + ": " + std::strerror(errno), errno};
}

// As the error of a system call, which none of those that open a store has.
constexpr int kNewerStore = EPROTONOSUPPORT;
// While other processes make the store or set it aside, its files may not belong together yet.
constexpr int kUnsettled = EIO;

// False for a database in which nothing was ever made. REQUIRES: a transaction, since another
// process may be making the store right now.
Result<bool> isStore(Database& database) {
  const auto application = database.integer("PRAGMA application_id");
  if (!application) return application.error();
  const auto version = database.integer("PRAGMA user_version");
  if (!version) return version.error();
  if (auto newer = newerThanKnown(database); !newer.empty()) {
    return Error{database.error(newer).message, kNewerStore};
  }
  const auto objects = database.integer("SELECT count(*) FROM sqlite_schema");
  if (!objects) return objects.error();
  if (*application == 0 && *version == 0 && *objects == 0) return false;
  if (*application != kApplicationId || *version < 1) {
    return database.error("a database, but not a metrics store");
  }
  if (auto checked = checkTables(database, *version); !checked) return checked.error();
  return true;
}

Result<std::optional<Database>> readFrom(Result<Database> database) {
  if (!database) return database.error();
  if (auto begun = database->execute("BEGIN"); !begun) return begun.error();
  const auto store = isStore(*database);
  if (!store) return store.error();
  if (!*store) return std::optional<Database>();
  return std::optional<Database>(std::move(*database));
}

// Two processes that make the store at once: SQLite refuses the change of mode to one of them at
// once instead of letting it wait.
Status useWriteAheadLog(Database& database) {
  constexpr int kAttempts = 2000;
  constexpr useconds_t kPause = 5000;
  for (int attempt = 1;; ++attempt) {
    auto done = database.execute("PRAGMA journal_mode = WAL");
    if (done || !database.busy() || attempt == kAttempts) return done;
    ::usleep(kPause);
  }
}

Status makeIfMissing(Database& database, const TableDefinition& table) {
  const auto exists = hasTable(database, table.name);
  if (!exists) return exists.error();
  return *exists ? Status(Done{}) : database.execute(table.text().c_str());
}

Status makeTables(Database& database) {
  if (auto set = database.execute("PRAGMA page_size = 8192"); !set) return set;
  if (auto set = useWriteAheadLog(database); !set) return set;
  if (auto begun = database.execute("BEGIN IMMEDIATE"); !begun) return begun;
  const auto store = isStore(database);  // somebody else may have been first
  Status made = store ? Status(Done{}) : store.error();
  if (store && !*store) made = makeRequiredTables(database, kSchemaVersion);
  if (made && !*store) made = enterSchema(database, kSchemaVersion);
  if (made) made = database.execute("COMMIT");
  if (!made) (void)database.execute("ROLLBACK");
  return made;
}

}  // namespace

Status makeRequiredTables(Database& database, std::int64_t version) {
  for (const TableDefinition& table : kTables) {
    if (!table.isIn(version)) continue;
    if (auto made = makeIfMissing(database, table); !made) return made;
  }
  return Done{};
}

Status enterSchema(Database& database, std::int64_t version) {
  std::string text;
  const auto drop = [&](const TableDefinition& table) {
    if (!table.isIn(version)) text += "DROP TABLE IF EXISTS " + std::string(table.name) + ";";
  };
  std::ranges::for_each(kTables, drop);
  std::ranges::for_each(kOptionalTables, drop);
  text += "PRAGMA application_id = " + std::to_string(kApplicationId) + ";";
  text += "PRAGMA user_version = " + std::to_string(version);
  return database.execute(text.c_str());
}

Result<std::int64_t> schemaVersion(Database& database) {
  return database.integer("PRAGMA user_version");
}

std::vector<std::string_view> storeTables() {
  std::vector<std::string_view> names;
  for (const TableDefinition& table : kTables) names.push_back(table.name);
  for (const TableDefinition& table : kOptionalTables) names.push_back(table.name);
  return names;
}

Result<bool> hasTable(Database& database, std::string_view name) {
  auto query = database.prepare("SELECT 1 FROM sqlite_schema WHERE type = 'table' AND name = ?");
  if (!query) return query.error();
  const Step step = query->bind(1, name).step();
  if (step == Step::Failed) return database.error();
  return step == Step::Row;
}

Result<std::vector<std::string_view>> presentTables(Database& database,
                                                    std::span<const std::string_view> names) {
  std::vector<std::string_view> present;
  for (const std::string_view name : names) {
    const auto exists = hasTable(database, name);
    if (!exists) return exists.error();
    if (*exists) present.push_back(name);
  }
  return present;
}

Status makeOptionalTable(Database& database, std::string_view name) {
  return makeIfMissing(database, *std::ranges::find(kOptionalTables, name, &TableDefinition::name));
}

StoreFile metricsStoreFile(const DeviceRoot& root) {
  constexpr std::size_t kNameStart = kStorePath.rfind('/') + 1;
  return {DeviceDirectory(root, std::string(kStorePath.substr(0, kNameStart - 1))),
          std::string(kStorePath.substr(kNameStart))};
}

bool isStoreKey(std::string_view key) {
  return !key.empty() && key.size() <= kLongestKey && key.find('\0') == std::string_view::npos &&
         isValidUtf8(key);
}

Result<std::optional<Database>> openStoreForReading(const StoreFile& file) {
  const auto directory = directoryOf(file);
  if (!directory) return directory.error();
  if (!*directory) return std::optional<Database>();
  const auto logBytes = [&] {
    const auto log = (*directory)->identity(file.name + "-wal");
    return log ? log->size : 0;
  };
  // A reader that may not write leaves the empty files of a write-ahead log. One that may
  // removes them when it ends as the last; and with nothing in that log, it has nothing to fold.
  auto store = readFrom(
      Database::open(**directory, file.name,
                     logBytes() == 0 ? Database::Access::ReadWrite : Database::Access::ReadOnly));
  if (store) return store;
  // Where no lock file can be made, nobody can be writing either; but what a writer has left in its
  // log could not be read this way, and without that the file may be half old, half new.
  if (::faccessat((*directory)->descriptor(), ".", W_OK, 0) == 0 || logBytes() > 0) return store;
  return readFrom(Database::open(**directory, file.name, Database::Access::Immutable));
}

std::string newerThanKnown(Database& database) {
  const auto application = database.integer("PRAGMA application_id");
  const auto version = database.integer("PRAGMA user_version");
  if (!application || *application != kApplicationId || !version || *version <= kSchemaVersion) {
    return {};
  }
  return "written by a newer version of the program (schema " + std::to_string(*version) +
         ", this one knows " + std::to_string(kSchemaVersion) + ")";
}

namespace {

Result<std::optional<Database>> openForWriting(const StoreFile& file, IfMissing ifMissing) {
  const bool create = ifMissing == IfMissing::Create;
  auto directory = directoryOf(file);
  if (!directory) return directory.error();
  if (!*directory) {
    if (!create) return std::optional<Database>();
    auto made = file.directory.make();
    if (!made) return Error{"metrics store " + file.text() + ": " + made.error().message};
    *directory = std::move(*made);
  }
  auto database = Database::open(**directory, file.name,
                                 create ? Database::Access::Create : Database::Access::ReadWrite);
  if (!database) return database.error();
  database->foldLogOnClose(false);  // not a byte of a file that turns out to be another's changes
  const auto failure = [&](Error error) {
    if (database->failedReading()) error.systemError = kUnsettled;
    return error;
  };
  if (auto begun = database->execute("BEGIN"); !begun) return failure(begun.error());
  const auto store = isStore(*database);
  if (!store) return failure(store.error());
  if (auto ended = database->execute("COMMIT"); !ended) return failure(ended.error());
  if (!*store) {
    if (!create) return std::optional<Database>();
    if (auto made = makeTables(*database); !made) return failure(made.error());
  }
  database->foldLogOnClose(true);
  // The log of a large import is not kept at its full length.
  if (auto set = database->execute("PRAGMA journal_size_limit = 4194304"); !set) return set.error();
  return std::optional<Database>(std::move(*database));
}

// Which file has the store's name; zeros if there is none.
std::pair<std::uint64_t, std::uint64_t> fileOf(const StoreFile& file) {
  const auto identity = file.directory.identity(file.name).value_or(FileIdentity());
  return {identity.device, identity.inode};
}

}  // namespace

Result<std::optional<Database>> openStoreForWriting(const StoreFile& file, IfMissing ifMissing) {
  constexpr int kAttempts = 20;
  constexpr useconds_t kPause = 10000;
  for (int attempt = 1;; ++attempt) {
    const auto former = fileOf(file);
    auto store = openForWriting(file, ifMissing);
    if (store || attempt == kAttempts) return store;
    if (store.error().systemError == kNewerStore) {
      if (auto moved = setNewerStoreAside(file); !moved) return moved.error();
    } else if (store.error().systemError == kUnsettled) {
      ::usleep(kPause);
    } else if (!awaitSettingAside(file) || fileOf(file) == former) {
      return store;  // not because another process set the file aside meanwhile
    }
  }
}

}  // namespace tally
