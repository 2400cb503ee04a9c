// SQLite handles that close themselves, and the few calls that the metrics store makes.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <string_view>

#include "base/files/directory.h"
#include "base/result.h"

struct sqlite3;
struct sqlite3_stmt;

namespace tally {

enum class Step { Row, Done, Failed };
enum class ColumnType { Null, Integer, Real, Text, Blob };

// How long the current step has taken, and how long it may take.
struct StepWatch {
  std::int64_t looks = 0, most = 0;
};

// A prepared statement, of a connection that outlives it. Parameters count from 1, columns from 0.
// Texts and blobs that are bound are borrowed until the next reset(); those of a column live until
// the next step() or reset().
class Statement {
 public:
  Statement& bind(int parameter, std::int64_t value);
  Statement& bind(int parameter, std::string_view text);
  Statement& bind(int parameter, std::span<const std::byte> blob);
  Step step();
  // Ready for other parameters; no longer blocks a commit.
  void reset();
  // Binds nothing, runs to its end, resets. False on failure.
  bool run();

  ColumnType type(int column) const;
  std::int64_t integer(int column) const;
  std::string_view text(int column) const;
  std::span<const std::byte> blob(int column) const;

 private:
  friend class Database;
  struct Finalise {
    void operator()(sqlite3_stmt* statement) const;
  };
  std::unique_ptr<sqlite3_stmt, Finalise> handle_;
  StepWatch* watch_ = nullptr;
};

// A connection. It waits a minute for the locks of others before an operation fails. The file may
// be hostile: code in its schema is disabled, a row larger than a store can have is an error, and
// so is a step that finds no row in the time in which any store could be read twice.
class Database {
 public:
  enum class Access {
    ReadOnly,
    Immutable,  // read only, without locks: for volumes on which no lock file can be made
    ReadWrite,
    Create,  // read and write; makes the file when it is missing, readable by its owner alone
  };
  // The database of that name in the directory. A file that is refused there (store_files.h) is an
  // error and is left as it is.
  static Result<Database> open(const Directory& directory, const std::string& name, Access access);
  // The same at a path that the caller chose, links in its directories included.
  static Result<Database> openAtPath(const std::string& path, Access access);

  const std::string& path() const { return path_; }
  Status execute(const char* sql);
  Result<Statement> prepare(std::string_view sql);
  // The one integer that a query or pragma answers with.
  Result<std::int64_t> integer(std::string_view sql);
  // How many rows the last statement that ended has written or removed.
  std::int64_t changes() const;
  // Keeps at most so many bytes of pages in memory, but for those that a transaction needs.
  Status limitMemory(std::size_t bytes);
  // Frees the pages that are kept for later.
  void releaseMemory();
  // Makes the predicate a function of SQL, with one argument of text. It must outlive the
  // statements that call it, and none of them may be running.
  Status addPredicate(const char* name, const std::function<bool(std::string_view)>& predicate);
  // Shuts all other connections out until this one is closed. False when one of them stays open for
  // longer than the patience. REQUIRES: nothing was read or written through this connection.
  Result<bool> shutOthersOut(std::chrono::milliseconds patience);
  // Writes all of the write-ahead log into the file and empties it. An error while others use it.
  Status foldLog();
  // Whether its directory has another file under this name by now, or none.
  bool wasReplaced() const;
  // A failure, in words that name the file; without a reason, the last call's.
  Error error() const;
  Error error(std::string_view reason) const;
  // Whether the last call failed since another connection held a lock.
  bool busy() const;
  // Whether the last call could not read or write a file of the database.
  bool failedReading() const;
  // Whether closing the last connection may fold the write-ahead log into the file.
  void foldLogOnClose(bool fold);

 private:
  struct Close {
    void operator()(sqlite3* handle) const;
  };
  std::string path_;
  std::unique_ptr<StepWatch> watch_;
  std::unique_ptr<sqlite3, Close> handle_;
};

}  // namespace tally
