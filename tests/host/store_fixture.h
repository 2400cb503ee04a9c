// A metrics store on disk, and what a test does with it.
#pragma once

#include <fmt/format.h>
#include <sqlite3.h>

#include <limits>
#include <numeric>
#include <string>
#include <string_view>
#include <vector>

#include "host/store/metrics_store.h"
#include "host/store/store_writer.h"
#include "host/temporary_root.h"

namespace tally {

constexpr std::int32_t kToday = 20514;
constexpr std::int32_t kFirst = std::numeric_limits<std::int32_t>::min();
constexpr std::int32_t kLast = std::numeric_limits<std::int32_t>::max();

inline std::vector<double> sequence(double first, std::size_t count) {
  std::vector<double> values(count);
  std::iota(values.begin(), values.end(), first);
  return values;
}

class StoreTest : public TemporaryRoot {
 protected:
  StoreTest() { clock->setDay(kToday, 3600); }

  std::shared_ptr<MetricsStore> store() const {
    return makeSqliteMetricsStore(storeFile, log, clock);
  }

  template <class Work>
  bool write(const Work& work) const {
    auto writer = StoreWriter::open(storeFile, IfMissing::Create);
    return writer && (*writer)->begin() && work(**writer) && (*writer)->commit();
  }
  bool set(std::int64_t day, std::string_view key, std::int64_t value) const {
    return write([&](StoreWriter& writer) {
      return writer.setScalar(static_cast<std::int32_t>(day), key, value);
    });
  }
  // Each value one second after the one before.
  bool push(std::int32_t day, std::string_view key, const std::vector<double>& values,
            bool inOrder = false) const {
    std::vector<std::uint32_t> offsets(values.size());
    std::iota(offsets.begin(), offsets.end(), 0u);
    return write([&](StoreWriter& writer) -> Status {
      return inOrder ? writer.appendSamples(day, key, {values, offsets, {}})
                     : writer.pushSamples(day, key, values, offsets);
    });
  }

  // A store of the raw schema, as earlier versions of the program made it.
  void makeRawStore() const {
    const auto directory = storeFile.directory.make();
    auto database = Database::open(*directory, storeFile.name, Database::Access::Create);
    ASSERT_TRUE(database && database->execute("PRAGMA page_size = 8192") &&
                database->execute("PRAGMA journal_mode = WAL; BEGIN") &&
                makeRequiredTables(*database, kRawSchema) && enterSchema(*database, kRawSchema) &&
                database->execute("COMMIT"));
  }
  // A row of `chunks` or `recent`.
  void addRaw(const std::string& table, std::int32_t day, const std::string& key, int number,
              const std::vector<double>& values, const std::vector<std::uint32_t>& offsets) const {
    const auto hex = [](auto column) {
      std::string text;
      for (const std::byte byte : std::as_bytes(std::span(column))) {
        text += fmt::format("{:02x}", std::to_integer<int>(byte));
      }
      return "x'" + text + "'";
    };
    sql(fmt::format("INSERT INTO {} VALUES ({}, '{}', {}, {}, {}, {})", table, day, key, number,
                    values.size(), hex(values), hex(offsets)));
  }

  // "20513 key=7" for each row.
  std::vector<std::string> scalars(std::string_view prefix = "", std::int32_t minimum = kFirst,
                                   std::int32_t maximum = kLast) const {
    std::vector<std::string> rows;
    store()->openHistory()->enumerateScalars(
        prefix, minimum, maximum,
        [&](std::string_view key, std::int32_t day, std::int64_t value, bool&) {
          rows.push_back(std::to_string(day) + " " + std::string(key) + "=" +
                         std::to_string(value));
        });
    return rows;
  }

  struct Distribution {
    std::int32_t day;
    std::string key;
    std::vector<double> values;
    std::vector<std::uint32_t> offsets, weights;
  };
  std::vector<Distribution> distributions(std::string_view prefix = "",
                                          std::int32_t minimum = kFirst,
                                          std::int32_t maximum = kLast,
                                          std::size_t batch = 1000) const {
    std::vector<Distribution> rows;
    store()->openHistory()->enumerateDistributions(
        prefix, minimum, maximum,
        [&](std::string_view key, std::int32_t day, DistributionValues& values, bool&) {
          Distribution row{day, std::string(key), {}, {}, {}};
          for (std::size_t count = batch, size = 0; count > 0;) {
            row.values.resize(size + batch);
            row.offsets.resize(size + batch);
            count = values.nextValues(&row.values[size], &row.offsets[size], batch);
            row.values.resize(size += count);
            row.offsets.resize(size);
            const auto weights = values.weights();
            row.weights.insert(row.weights.end(), weights.begin(), weights.end());
            row.weights.resize(size, 1);
          }
          rows.push_back(std::move(row));
        });
    return rows;
  }
  // As "20513 key x3" for each row.
  std::vector<std::string> lengths() const {
    std::vector<std::string> rows;
    for (const Distribution& row : distributions()) {
      rows.push_back(std::to_string(row.day) + " " + row.key + " x" +
                     std::to_string(row.values.size()));
    }
    return rows;
  }

  // Runs SQL on the file directly; the first column of the last row.
  std::string sql(const std::string& text) const {
    sqlite3* handle = nullptr;
    EXPECT_EQ(::sqlite3_open(path.c_str(), &handle), SQLITE_OK);
    std::string answer;
    char* message = nullptr;
    ::sqlite3_exec(
        handle, text.c_str(),
        [](void* out, int, char** columns, char**) {
          *static_cast<std::string*>(out) = columns[0] != nullptr ? columns[0] : "NULL";
          return 0;
        },
        &answer, &message);
    EXPECT_EQ(message, nullptr) << message;
    ::sqlite3_free(message);
    ::sqlite3_close(handle);
    return answer;
  }

  StoreFile storeFile{{root, "/data"}, "TBDataStore.sqlitedb"};
  std::string path = at("data/TBDataStore.sqlitedb");
};

}  // namespace tally
