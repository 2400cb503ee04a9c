#include "platform/linux/store_schema.h"

#include <unistd.h>

#include <filesystem>

#include "base/file.h"
#include "base/utf8.h"

namespace tally {
namespace {

constexpr std::int64_t kApplicationId = 0x54424453;  // "TBDS"
constexpr std::int64_t kSchemaVersion = 1;
constexpr std::size_t kLongestKey = 512;

// Days and keys are in the order of every pass, so a pass is one walk along the tree. New samples
// go to a small table of their own, which is cheap to write; a checkpoint moves them to the chunks.
constexpr const char* kCreate = R"sql(
CREATE TABLE scalars(
  day INTEGER NOT NULL, key TEXT NOT NULL, value INTEGER NOT NULL,
  PRIMARY KEY(day, key)) WITHOUT ROWID;
CREATE TABLE chunks(
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL, samples INTEGER NOT NULL,
  sample_values BLOB NOT NULL, sample_offsets BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID;
CREATE TABLE recent(
  day INTEGER NOT NULL, key TEXT NOT NULL, number INTEGER NOT NULL, samples INTEGER NOT NULL,
  sample_values BLOB NOT NULL, sample_offsets BLOB NOT NULL,
  PRIMARY KEY(day, key, number)) WITHOUT ROWID;
PRAGMA application_id = 0x54424453;
PRAGMA user_version = 1;
)sql";

enum class Presence { Missing, Present };

Result<Presence> examine(const std::string& path) {
  std::error_code code;
  const auto status = std::filesystem::status(path, code);
  if (status.type() == std::filesystem::file_type::not_found) return Presence::Missing;
  if (code) return Error{"metrics store " + path + ": " + code.message(), code.value()};
  if (status.type() != std::filesystem::file_type::regular) {
    return Error{"metrics store " + path + ": not a regular file"};
  }
  return Presence::Present;
}

// False for a database in which nothing was ever made. REQUIRES: a transaction, since another
// process may be making the store right now.
Result<bool> isStore(Database& database) {
  const auto application = database.integer("PRAGMA application_id");
  if (!application) return application.error();
  const auto version = database.integer("PRAGMA user_version");
  if (!version) return version.error();
  const auto objects = database.integer("SELECT count(*) FROM sqlite_schema");
  if (!objects) return objects.error();
  if (*application == 0 && *version == 0 && *objects == 0) return false;
  if (*application != kApplicationId || *version < 1) {
    return database.error("a database, but not a metrics store");
  }
  if (*version > kSchemaVersion) {
    return database.error("written by a newer version of the program (schema " +
                          std::to_string(*version) + ", this one knows " +
                          std::to_string(kSchemaVersion) + ")");
  }
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

Status makeTables(Database& database) {
  if (auto set = database.execute("PRAGMA page_size = 8192"); !set) return set;
  if (auto set = useWriteAheadLog(database); !set) return set;
  if (auto begun = database.execute("BEGIN IMMEDIATE"); !begun) return begun;
  const auto store = isStore(database);  // somebody else may have been first
  Status made = !store ? Status(store.error()) : *store ? Done{} : database.execute(kCreate);
  if (made) made = database.execute("COMMIT");
  if (!made) (void)database.execute("ROLLBACK");
  return made;
}

}  // namespace

const std::string kStoreFile = "TBDataStore.sqlitedb";

DeviceDirectory storeDirectory(const DeviceRoot& root) {
  return {root, "/var/mobile/Library/Tallybook"};
}

std::string metricsStorePath(const DeviceRoot& root) {
  return storeDirectory(root).text() + "/" + kStoreFile;
}

bool isStoreKey(std::string_view key) {
  return !key.empty() && key.size() <= kLongestKey && key.find('\0') == std::string_view::npos &&
         isValidUtf8(key);
}

Result<std::optional<Database>> openStoreForReading(const std::string& path) {
  const auto presence = examine(path);
  if (!presence) return presence.error();
  if (*presence == Presence::Missing) return std::optional<Database>();
  // A reader that may not write leaves the empty files of a write-ahead log behind. One that may
  // removes them when it ends as the last; and with nothing in that log, it has nothing to fold.
  const bool logIsEmpty = fileSize(path + "-wal").value_or(0) == 0;
  auto store = readFrom(
      Database::open(path, logIsEmpty ? Database::Access::ReadWrite : Database::Access::ReadOnly));
  if (store) return store;
  // Where no lock file can be made, nobody can be writing either; but what a writer has left in its
  // log could not be read this way, and without that the file may be half old, half new.
  if (::access(std::filesystem::path(path).parent_path().c_str(), W_OK) == 0 ||
      fileSize(path + "-wal").value_or(0) > 0) {
    return store;
  }
  return readFrom(Database::open(path, Database::Access::Immutable));
}

Result<std::optional<Database>> openStoreForWriting(const std::string& path, IfMissing ifMissing) {
  const auto presence = examine(path);
  if (!presence) return presence.error();
  const bool create = ifMissing == IfMissing::Create;
  if (*presence == Presence::Missing) {
    if (!create) return std::optional<Database>();
    if (auto made = DeviceRoot(path.starts_with('/') ? "/" : ".")
                        .make(std::filesystem::path(path).parent_path().native());
        !made) {
      return Error{"metrics store " + path + ": " + made.error().message};
    }
  }
  auto database =
      Database::open(path, create ? Database::Access::Create : Database::Access::ReadWrite);
  if (!database) return database.error();
  database->foldLogOnClose(false);  // not a byte of a file that turns out to be another's changes
  if (auto begun = database->execute("BEGIN"); !begun) return begun.error();
  const auto store = isStore(*database);
  if (!store) return store.error();
  if (auto ended = database->execute("COMMIT"); !ended) return ended.error();
  if (!*store) {
    if (!create) return std::optional<Database>();
    if (auto made = makeTables(*database); !made) return made.error();
  }
  database->foldLogOnClose(true);
  // The log of a large import is not kept at its full length.
  if (auto set = database->execute("PRAGMA journal_size_limit = 4194304"); !set) return set.error();
  return std::optional<Database>(std::move(*database));
}

}  // namespace tally
