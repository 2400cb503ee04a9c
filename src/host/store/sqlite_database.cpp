#include "host/store/sqlite_database.h"

#include <fcntl.h>
#include <sqlite3.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>

#include "base/hex.h"
#include "host/store/store_files.h"

namespace tally {
namespace {

constexpr std::chrono::minutes kLongestWaitForLock{1};

// A process that makes one durable commit after the other leaves the lock free for microseconds
// only. SQLite's own waiting looks for such a moment ten times a second and may find none.
int waitForLock(void*, int attempts) {
  using std::chrono::steady_clock;
  thread_local steady_clock::time_point start;
  if (attempts == 0) start = steady_clock::now();
  if (steady_clock::now() - start >= kLongestWaitForLock) return 0;
  ::usleep(1000);
  return 1;
}

// The path as a URI that asks SQLite to read without locks.
std::string immutableUri(std::string_view path) {
  std::string uri = "file:";
  for (const char c : path) {
    if (c == '%' || c == '?' || c == '#') {
      uri += '%';
      appendHex(uri, static_cast<unsigned char>(c), 2, kUpperHexDigits);
    } else {
      uri += c;
    }
  }
  return uri + "?immutable=1";
}

// SQLite would make a new file with the modes of the umask and for whoever runs; what it lays
// beside a file gets the modes and the owner of that file. Only a file that is not there yet is
// opened here: closing any other would drop the locks that this process holds on it.
Status makePrivateFile(const Directory& directory, const std::string& name) {
  const auto file = directory.create(name, 0600);
  if (file) return directory.sync();
  if (file.error().systemError == EEXIST) return Done{};
  return Error{"metrics store: " + file.error().message, file.error().systemError};
}

// A chunk of another writer has up to a million samples, of twelve bytes each.
constexpr int kLargestRow = 16 << 20;

// How often a step is checked, rarely enough to cost nothing, and how many checks end it: reading a
// whole store takes about three instructions for each byte, and no small one needs the minimum. A
// loop in a damaged tree or a schema has no end.
constexpr int kInstructionsBetweenLooks = 1'000'000;
constexpr std::int64_t kInstructionsPerByte = 8, kLooksAtLeast = 20;
constexpr std::uint64_t kMostBytesWatched = 1u << 30;  // a file may have holes

int stepTakesTooLong(void* watch) {
  auto& step = *static_cast<StepWatch*>(watch);
  return ++step.looks > step.most ? 1 : 0;
}

// Nothing of this is needed by the tables that the program makes.
bool distrust(sqlite3* handle, StepWatch& watch) {
  const struct {
    int option, value;
  } kOptions[] = {
      {SQLITE_DBCONFIG_DEFENSIVE, 1},      {SQLITE_DBCONFIG_TRUSTED_SCHEMA, 0},
      {SQLITE_DBCONFIG_ENABLE_TRIGGER, 0}, {SQLITE_DBCONFIG_ENABLE_VIEW, 0},
      {SQLITE_DBCONFIG_ENABLE_FKEY, 0},    {SQLITE_DBCONFIG_DQS_DDL, 0},
      {SQLITE_DBCONFIG_DQS_DML, 0},
  };
  for (const auto& [option, value] : kOptions) {
    if (::sqlite3_db_config(handle, option, value, nullptr) != SQLITE_OK) return false;
  }
  ::sqlite3_limit(handle, SQLITE_LIMIT_LENGTH, kLargestRow);
  ::sqlite3_limit(handle, SQLITE_LIMIT_ATTACHED, 0);
  ::sqlite3_progress_handler(handle, kInstructionsBetweenLooks, stepTakesTooLong, &watch);
  return true;
}

}  // namespace

void Statement::Finalise::operator()(sqlite3_stmt* statement) const {
  ::sqlite3_finalize(statement);
}

Statement& Statement::bind(int parameter, std::int64_t value) {
  ::sqlite3_bind_int64(handle_.get(), parameter, value);
  return *this;
}

Statement& Statement::bind(int parameter, std::string_view text) {
  ::sqlite3_bind_text64(handle_.get(), parameter, text.data() != nullptr ? text.data() : "",
                        text.size(), SQLITE_STATIC, SQLITE_UTF8);
  return *this;
}

Statement& Statement::bind(int parameter, std::span<const std::byte> blob) {
  const void* const bytes = blob.data() != nullptr ? static_cast<const void*>(blob.data()) : "";
  ::sqlite3_bind_blob64(handle_.get(), parameter, bytes, blob.size(), SQLITE_STATIC);
  return *this;
}

// One that could not be prepared fails, as every call on it does.
Step Statement::step() {
  if (watch_ != nullptr) watch_->looks = 0;
  switch (::sqlite3_step(handle_.get())) {
    case SQLITE_ROW:
      return Step::Row;
    case SQLITE_DONE:
      return Step::Done;
    default:
      return Step::Failed;
  }
}

void Statement::reset() { ::sqlite3_reset(handle_.get()); }

bool Statement::run() {
  Step result = Step::Row;
  while (result == Step::Row) result = step();
  reset();
  return result == Step::Done;
}

ColumnType Statement::type(int column) const {
  switch (::sqlite3_column_type(handle_.get(), column)) {
    case SQLITE_INTEGER:
      return ColumnType::Integer;
    case SQLITE_FLOAT:
      return ColumnType::Real;
    case SQLITE_TEXT:
      return ColumnType::Text;
    case SQLITE_BLOB:
      return ColumnType::Blob;
    default:
      return ColumnType::Null;
  }
}

std::int64_t Statement::integer(int column) const {
  return ::sqlite3_column_int64(handle_.get(), column);
}

std::string_view Statement::text(int column) const {
  const auto* bytes = static_cast<const char*>(::sqlite3_column_blob(handle_.get(), column));
  return {bytes != nullptr ? bytes : "", blob(column).size()};
}

std::span<const std::byte> Statement::blob(int column) const {
  const auto* bytes = static_cast<const std::byte*>(::sqlite3_column_blob(handle_.get(), column));
  if (bytes == nullptr) return {};
  return {bytes, static_cast<std::size_t>(::sqlite3_column_bytes(handle_.get(), column))};
}

void Database::Close::operator()(sqlite3* handle) const { ::sqlite3_close_v2(handle); }

Result<Database> Database::open(const Directory& directory, const std::string& name,
                                Access access) {
  int flags = SQLITE_OPEN_NOMUTEX | SQLITE_OPEN_EXRESCODE;
  switch (access) {
    case Access::ReadOnly:
      flags |= SQLITE_OPEN_READONLY;
      break;
    case Access::Immutable:
      flags |= SQLITE_OPEN_READONLY | SQLITE_OPEN_URI;
      break;
    case Access::Create:
      if (auto made = makePrivateFile(directory, name); !made) return made.error();
      flags |= SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE;
      break;
    case Access::ReadWrite:
      flags |= SQLITE_OPEN_READWRITE;
      break;
  }
  Database database;
  database.watch_ = std::make_unique<StepWatch>(StepWatch{0, kLooksAtLeast});
  database.path_ = directory.pathOf(name);
  const char* const fileSystem = storeFileSystem();
  if (fileSystem == nullptr) return database.error("SQLite cannot open it through its directory");
  (void)takeStoreFileRefusal();
  sqlite3* handle = nullptr;
  const std::string path = storeFileName(directory, name);
  const std::string text = access == Access::Immutable ? immutableUri(path) : path;
  const int code = ::sqlite3_open_v2(text.c_str(), &handle, flags, fileSystem);
  database.handle_.reset(handle);
  if (code != SQLITE_OK) return database.error();
  ::sqlite3_busy_handler(handle, waitForLock, nullptr);
  for (const char* end : {"", "-wal"}) {
    const auto file = directory.identity(name + end);
    const auto bytes =
        static_cast<std::int64_t>(std::min(file ? file->size : 0, kMostBytesWatched));
    database.watch_->most += bytes / kInstructionsBetweenLooks * kInstructionsPerByte;
  }
  if (!distrust(handle, *database.watch_))
    return database.error("SQLite cannot be kept from trusting it");
  return database;
}

Result<Database> Database::openAtPath(const std::string& path, Access access) {
  const auto slash = path.rfind('/');
  const auto directory =
      Directory::open(slash == std::string::npos ? "." : path.substr(0, slash + 1));
  if (!directory) return directory.error();
  return open(*directory, path.substr(slash + 1), access);
}

Status Database::execute(const char* sql) {
  watch_->looks = 0;
  if (::sqlite3_exec(handle_.get(), sql, nullptr, nullptr, nullptr) != SQLITE_OK) return error();
  return Done{};
}

Result<Statement> Database::prepare(std::string_view sql) {
  sqlite3_stmt* handle = nullptr;
  const int code = ::sqlite3_prepare_v3(handle_.get(), sql.data(), static_cast<int>(sql.size()),
                                        SQLITE_PREPARE_PERSISTENT, &handle, nullptr);
  if (code != SQLITE_OK) return error();
  Statement statement;
  statement.handle_.reset(handle);
  statement.watch_ = watch_.get();
  return statement;
}

Result<std::int64_t> Database::integer(std::string_view sql) {
  auto statement = prepare(sql);
  if (!statement) return statement.error();
  if (statement->step() != Step::Row) return error();
  return statement->integer(0);
}

std::int64_t Database::changes() const { return ::sqlite3_changes64(handle_.get()); }

Status Database::limitMemory(std::size_t bytes) {
  return execute(("PRAGMA cache_size = -" + std::to_string(bytes / 1024)).c_str());
}

void Database::releaseMemory() { ::sqlite3_db_release_memory(handle_.get()); }

Status Database::addPredicate(const char* name,
                              const std::function<bool(std::string_view)>& predicate) {
  const auto call = [](sqlite3_context* context, int, sqlite3_value** arguments) {
    const auto& test =
        *static_cast<const std::function<bool(std::string_view)>*>(::sqlite3_user_data(context));
    const auto* const text = reinterpret_cast<const char*>(::sqlite3_value_text(arguments[0]));
    const auto length = static_cast<std::size_t>(::sqlite3_value_bytes(arguments[0]));
    ::sqlite3_result_int(context, text != nullptr && test({text, length}) ? 1 : 0);
  };
  const int code =
      ::sqlite3_create_function_v2(handle_.get(), name, 1, SQLITE_UTF8 | SQLITE_DIRECTONLY,
                                   const_cast<std::function<bool(std::string_view)>*>(&predicate),
                                   call, nullptr, nullptr, nullptr);
  if (code != SQLITE_OK) return error();
  return Done{};
}

// With the mode set before the first transaction, SQLite locks the file for as long as it is open,
// and every other connection holds a lock on it.
Result<bool> Database::shutOthersOut(std::chrono::milliseconds patience) {
  ::sqlite3_busy_timeout(handle_.get(), static_cast<int>(patience.count()));
  const auto locked = execute("PRAGMA locking_mode = EXCLUSIVE; BEGIN EXCLUSIVE; COMMIT");
  const bool isBusy = !locked && busy();
  ::sqlite3_busy_handler(handle_.get(), waitForLock, nullptr);
  if (!locked && !isBusy) return locked.error();
  return !isBusy;
}

Status Database::foldLog() {
  const int code = ::sqlite3_wal_checkpoint_v2(handle_.get(), nullptr, SQLITE_CHECKPOINT_TRUNCATE,
                                               nullptr, nullptr);
  return code == SQLITE_OK ? Status(Done{}) : error();
}

bool Database::wasReplaced() const {
  int moved = 0;
  const int code = ::sqlite3_file_control(handle_.get(), "main", SQLITE_FCNTL_HAS_MOVED, &moved);
  return code != SQLITE_OK || moved != 0;
}

Error Database::error() const {
  if (auto refusal = takeStoreFileRefusal(); !refusal.empty()) return {"metrics store: " + refusal};
  if (handle_ && ::sqlite3_errcode(handle_.get()) == SQLITE_INTERRUPT) {
    return error("a step has no end; the file is damaged");
  }
  return error(handle_ ? ::sqlite3_errmsg(handle_.get()) : "out of memory");
}

Error Database::error(std::string_view reason) const {
  return {"metrics store " + path_ + ": " + std::string(reason)};
}

bool Database::failedReading() const {
  return (::sqlite3_errcode(handle_.get()) & 0xff) == SQLITE_IOERR;
}

bool Database::busy() const { return (::sqlite3_errcode(handle_.get()) & 0xff) == SQLITE_BUSY; }

void Database::foldLogOnClose(bool fold) {
  ::sqlite3_db_config(handle_.get(), SQLITE_DBCONFIG_NO_CKPT_ON_CLOSE, fold ? 0 : 1, nullptr);
}

}  // namespace tally
