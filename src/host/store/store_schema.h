// The metrics store as a file: its place, its identity, and how it is opened.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "host/store/sqlite_database.h"

namespace tally {

// Where a store lies.
struct StoreFile {
  DeviceDirectory directory;
  std::string name;
  // Told what was done to the file itself, in words that name it; may be empty.
  std::function<void(const std::string& message)> notify = {};

  // For messages.
  std::string text() const { return directory.text() + "/" + name; }
};

// The store of a device.
StoreFile metricsStoreFile(const DeviceRoot& root);

// A key of the store is valid UTF-8 of 1 to 512 bytes without a zero byte.
bool isStoreKey(std::string_view key);
constexpr std::string_view kStoreKeyRule =
    "a key is valid UTF-8 of 1 to 512 bytes without a zero byte";

// Tables that a store may lack until something is kept in them.
constexpr std::string_view kCountersTable = "counters", kWearTable = "wear";
// Of what the recorder commits: new samples, those that a checkpoint has put in order, who owns a
// key, and changes that wait for a day.
constexpr std::string_view kArrivalsTable = "arrivals", kPackedTable = "packed",
                           kOwnersTable = "owners", kUndatedTable = "undated";
// Every table that a store may have, but for SQLite's own.
std::vector<std::string_view> storeTables();
Result<bool> hasTable(Database& database, std::string_view name);
// Makes one of them if it is missing. REQUIRES: a transaction of a writer.
Status makeOptionalTable(Database& database, std::string_view name);

// What makes a store one of a newer version of the program, in words; empty for any other file, and
// when it cannot be read. No table is looked at.
std::string newerThanKnown(Database& database);

// Opens the store in its present state: later commits of others are not seen. Nothing is created.
// Empty when there is no store yet; an error when there is something else in its place, or a store
// of a newer version of the program, which the next writer sets aside.
Result<std::optional<Database>> openStoreForReading(const StoreFile& file);

enum class IfMissing { Leave, Create };
// Opens the store for writing. With Leave, empty when there is no store yet. One of a newer version
// of the program is set aside (store_aside.h); whatever is not a store is left as it is.
Result<std::optional<Database>> openStoreForWriting(const StoreFile& file, IfMissing ifMissing);

}  // namespace tally
