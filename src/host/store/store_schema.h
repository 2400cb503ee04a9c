// The metrics store as a file: its place, its identity, and how it is opened.
#pragma once

#include <functional>
#include <optional>
#include <span>
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

// Versions of the schema. In the raw one, samples that need no packing lie in chunks, as they are;
// in the packed one, all are packed.
constexpr std::int64_t kRawSchema = 1, kPackedSchema = 2;

// The tables of samples: chunks, recent ones and packed rows of the raw schema, series of the
// packed one; and new samples, until a checkpoint puts them in order.
constexpr std::string_view kChunksTable = "chunks", kRecentTable = "recent",
                           kPackedTable = "packed", kSeriesTable = "series",
                           kArrivalsTable = "arrivals";
// In the order in which the samples of a key were recorded.
constexpr std::string_view kSampleTables[] = {kChunksTable, kRecentTable, kPackedTable,
                                              kSeriesTable, kArrivalsTable};
// Other tables that a store may lack until something is kept in them: of the job, and of the
// recorder who owns a key, and changes that wait for a day.
constexpr std::string_view kCountersTable = "counters", kWearTable = "wear",
                           kOwnersTable = "owners", kUndatedTable = "undated";
// Every table that a store may have, but for SQLite's own.
std::vector<std::string_view> storeTables();
Result<bool> hasTable(Database& database, std::string_view name);
// Those of the tables that the store has, in the same order.
Result<std::vector<std::string_view>> presentTables(Database& database,
                                                    std::span<const std::string_view> names);
// Makes one of those that a store may lack if it is missing. REQUIRES: a transaction of a writer.
Status makeOptionalTable(Database& database, std::string_view name);

// What makes a store one of a newer version of the program, in words; empty for any other file, and
// when it cannot be read. No table is looked at.
std::string newerThanKnown(Database& database);

Result<std::int64_t> schemaVersion(Database& database);
// A store enters a version of the schema in two steps, or an empty database becomes a store: the
// tables that the version requires are made, and those that it does not have are removed, with all
// that they hold. REQUIRES: one transaction of a writer.
Status makeRequiredTables(Database& database, std::int64_t version);
Status enterSchema(Database& database, std::int64_t version);

// Opens the store in its present state: later commits of others are not seen. Nothing is created.
// Empty when there is no store yet; an error when there is something else in its place, or a store
// of a newer version of the program, which the next writer sets aside.
Result<std::optional<Database>> openStoreForReading(const StoreFile& file);

enum class IfMissing { Leave, Create };
// Opens the store for writing. With Leave, empty when there is no store yet. One of a newer version
// of the program is set aside (store_aside.h); whatever is not a store is left as it is.
Result<std::optional<Database>> openStoreForWriting(const StoreFile& file, IfMissing ifMissing);

}  // namespace tally
