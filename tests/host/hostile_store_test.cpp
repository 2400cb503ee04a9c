// What damage and hostile files do to the metrics store, and to other files through it.
#include <sys/stat.h>
#include <unistd.h>

#include <functional>
#include <random>
#include <span>

#include "host/store/recording/recording_store.h"
#include "host/store/store_history.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string kEndless = "WITH RECURSIVE n(x) AS (SELECT 1 UNION ALL SELECT x + 1 FROM n) ";

TEST_F(StoreTest, WhatIsNoStoreIsNamedOnceAndLeftAsItIs) {
  const struct {
    const char* name;
    std::function<void()> spoil;
    const char* reason;
  } cases[] = {
      {"text", [&] { put("data/TBDataStore.sqlitedb", std::string(5000, 't')); }, "not a database"},
      {"short", [&] { std::filesystem::resize_file(path, 60); }, "malformed"},
      {"foreign", [&] { sql("PRAGMA application_id = 7"); }, "not a metrics store"},
      {"tables of another version", [&] { sql("PRAGMA user_version = 1"); }, "its tables are not"},
      {"no tables", [&] { sql("DROP TABLE scalars; DROP TABLE series"); }, "its tables are not"},
      {"endless view",
       [&] {
         sql("DROP TABLE scalars; CREATE VIEW scalars AS " + kEndless +
             "SELECT x AS day, 'k' AS key, 1 AS value FROM n");
       },
       "its tables are not"},
      {"trigger",
       [&] { sql("CREATE TRIGGER t AFTER INSERT ON scalars BEGIN DELETE FROM series; END"); },
       "its tables are not"},
      {"pipe", [&] { std::filesystem::remove(path), ::mkfifo(path.c_str(), 0600); },
       "not a regular file"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove_all(at("data"));
    store()->TBClientSetValueForScalarKey("a", 1);
    c.spoil();
    const std::string before = get("data/TBDataStore.sqlitedb");
    useBoundedLog();
    const auto spoiled = store();
    spoiled->TBClientCheckpoint();
    EXPECT_THAT(scalars(), IsEmpty());
    spoiled->TBClientSetValueForScalarKey("b", 2);
    EXPECT_THAT(errors(), ElementsAre(AllOf(HasSubstr(path), HasSubstr(c.reason))));
    EXPECT_EQ(get("data/TBDataStore.sqlitedb"), before);
  }
}

TEST_F(StoreTest, NoForeignFileIsOpenedGivenAwayOrRemoved) {
  if (::geteuid() != 0) GTEST_SKIP() << "needs a directory of another user";
  constexpr uid_t kUser = 65534;
  const auto pipe = [](const char*, const char* file) { return ::mkfifo(file, 0600); };
  // When it has been rolled back, SQLite removes the file that it names.
  const auto putJournal = [&](const std::string& name) {
    const auto word = [](std::uint64_t number) {
      std::string bytes;
      for (int shift = 24; shift >= 0; shift -= 8) bytes += static_cast<char>(number >> shift);
      return bytes;
    };
    const std::string magic = "\xd9\xd5\x05\xf9\x20\xa1\x63\xd7";
    std::string text = magic + word(0) + word(0) + word(std::filesystem::file_size(path) / 8192) +
                       word(512) + word(8192);
    text.resize(512);
    const auto sum = std::accumulate(name.begin(), name.end(), std::uint64_t{0});
    put("data/TBDataStore.sqlitedb-journal",
        text + word((1u << 30) / 8192 + 1) + name + word(name.size()) + word(sum) + magic);
  };
  const struct {
    const char *name, *end;
    int (*make)(const char*, const char*);
  } cases[] = {
      {"link", "", ::symlink},
      {"link", "-wal", ::symlink},
      {"link", "-journal", ::symlink},
      {"hard link", "", ::link},
      {"hard link", "-wal", ::link},
      {"pipe", "-wal", pipe},
      {"journal of a foreign file", "-journal", nullptr},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.name) + " " + c.end);
    std::filesystem::remove_all(at("data"));
    std::filesystem::create_directory(at("data"));
    ASSERT_EQ(::chown(at("data").c_str(), kUser, kUser), 0);
    store()->TBClientSetValueForScalarKey("a", 1);
    put("precious", "root's");
    if (*c.end == '\0') std::filesystem::remove(path);
    const std::string precious = at("precious"), made = path + c.end;
    if (c.make == nullptr) {
      putJournal(precious);
    } else {
      ASSERT_EQ(c.make(precious.c_str(), made.c_str()), 0);
    }
    useBoundedLog();
    const auto spoiled = store();
    spoiled->TBClientCheckpoint();
    spoiled->TBClientSetValueForScalarKey("b", 2);
    (void)spoiled->openHistory();
    EXPECT_EQ(errors().size(), c.make != nullptr) << testing::PrintToString(errors());
    EXPECT_THAT(errors(), testing::Each(HasSubstr(made)));
    struct stat status {};
    ASSERT_EQ(::stat(precious.c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, 0u);
    EXPECT_EQ(get("precious"), "root's");
  }
}

TEST_F(StoreTest, WhatHasNoEndIsEnded) {
  store()->TBClientSetValueForScalarKey("a", 1);
  auto database = Database::openAtPath(path, Database::Access::ReadOnly);
  ASSERT_TRUE(database);
  const auto counted = database->integer(kEndless + "SELECT count(*) FROM n");
  ASSERT_FALSE(counted);
  EXPECT_THAT(counted.error().message, HasSubstr("no end"));

  sql(kEndless + "INSERT INTO scalars SELECT 1, CAST(x AS TEXT), x FROM n LIMIT 4000");
  const auto page =
      std::stoul(sql("SELECT rootpage - 1 FROM sqlite_schema WHERE name = 'scalars'")) * 8192;
  std::string spoiled = get("data/TBDataStore.sqlitedb");
  const std::string child = spoiled.substr(page + 8, 4);  // the last one, now in place of each
  const auto word = [&](std::size_t at) {
    return static_cast<unsigned char>(spoiled[at]) * 256u +
           static_cast<unsigned char>(spoiled[at + 1]);
  };
  for (std::size_t cell = 0; cell < word(page + 3); ++cell) {
    spoiled.replace(page + word(page + 12 + 2 * cell), 4, child);
  }
  put("data/TBDataStore.sqlitedb", spoiled);
  useBoundedLog();
  EXPECT_LT(scalars().size(), 4000u);
  EXPECT_THAT(errors(), ElementsAre(HasSubstr("out of order")));
}

TEST_F(StoreTest, DamagedRowsAreLeftOutAndKept) {
  const std::string values = "x'0003" + std::string(18, '0') + std::string(32, '0') + "'";
  const std::string constant = "x'0000" + std::string(18, '0') + std::string(16, '0') + "'";
  const std::string offsets = "zeroblob(8)";
  const std::string scalars[] = {"(1, 'text', 'x')", "(1, 'real', 1.5)", "(1, '', 1)",
                                 "(1, CAST(x'61ff' AS TEXT), 1)"};
  const std::vector<std::string> raw[] = {
      {"chunks", "(1, 'good', 5, 2, zeroblob(16), zeroblob(4))",
       "(1, 'lie', 0, 3, zeroblob(16), zeroblob(8))", "(1, 'negative', 0, -1, x'', x'')",
       "(1, 'huge', 0, 1152921504606846976, zeroblob(8), zeroblob(4))",
       "(1, 'numbers', 0, 'two', 3, 4.5)", "(1, 'last', 2147483647, 1, zeroblob(8), zeroblob(4))"},
      {"recent", "(1, 'odd', 0, 1, zeroblob(7), zeroblob(4))",
       "(1, 'good', -7, 1, zeroblob(8), x'')",
       "(9223372036854775807, 'far', 0, 1, zeroblob(8), zeroblob(4))"}};
  const std::vector<std::string> packed[] = {
      {"series", "(1, 'good', 5, 2, 2, x'', x'', " + offsets + ")",
       "(1, 'good', -7, 3, 3, x'" + values.substr(2) + ", x'', " + offsets + ")",
       "(1, 'weight', 0, 1, 2, " + constant + ", x'', " + offsets + ")",
       "(1, 'unweighted', 0, 1, 1, " + constant + ", zeroblob(4), " + offsets + ")",
       "(1, 'form', 0, 1, 1, x'04" + constant.substr(4) + ", x'', " + offsets + ")",
       "(1, 'huge', 0, 16385, 16385, " + constant + ", x'', " + offsets + ")",
       "(1, 'wide', 0, 2, 2, " + constant + ", x'', zeroblob(65545))",
       "(1, 'numbers', 0, 'two', 3, 4.5, 6, 7)",
       "(1, 'last', 2147483647, 1, 1, " + constant + ", x'', " + offsets + ")"},
      {"arrivals", "(7, 1, 'good', 1, 1, x'01')", "(8, 9223372036854775807, 'far', 1, 1, x'')"}};
  for (const std::span<const std::vector<std::string>> tables :
       {std::span(raw), std::span(packed)}) {
    SCOPED_TRACE(tables[0][0]);
    std::filesystem::remove_all(at("data"));
    if (tables[0][0] == "chunks") makeRawStore();
    clock->setDay(kToday);
    ASSERT_TRUE(push(1, "good", {1, 2, 3}, true) && push(1, "good", {4}));
    store()->TBClientSetValueForScalarKey("good", 1);
    for (const std::string& row : scalars) sql("INSERT INTO scalars VALUES " + row);
    for (const auto& table : tables) {
      for (const std::string& row : std::span(table).subspan(1)) {
        sql("INSERT INTO " + table[0] + " VALUES " + row);
      }
    }
    clock->setDay(1);
    const auto check = [&](const char* when) {
      useBoundedLog();
      EXPECT_THAT(this->scalars(), ElementsAre("20514 good=1")) << when;
      EXPECT_THAT(lengths(), ElementsAre("1 good x4", "1 last x1")) << when;
      ASSERT_EQ(errors().size(), 2u) << when << ": one line for each enumeration";
      EXPECT_THAT(errors()[0], HasSubstr("damaged rows are left out"));
    };
    check("at first");
    store()->TBClientCheckpoint();
    const std::string left = sql("SELECT count(*) FROM " + tables[1][0]);
    EXPECT_EQ(left, std::to_string(tables[1].size() - 1)) << "the damaged ones and the far day";
    check("after a checkpoint");
  }
}

TEST_F(StoreTest, RandomDamageIsNeverMoreThanAnError) {
  ASSERT_TRUE(push(1, "d", sequence(0, 9000), true) && push(1, "e", sequence(0, 300)));
  for (int i = 0; i < 41; ++i) ASSERT_TRUE(set(1, std::to_string(i), i));
  for (const char* step : {"in order", "arrivals"}) {
    const auto values = sequence(0.5, 3000);
    const std::vector<std::uint32_t> offsets(values.size(), 1), weights(values.size(), 2);
    const auto recorded = makeSqliteRecordingStore(storeFile)->begin();
    const RecordedChange samples{RecordedChange::Kind::Samples, "w", 0, {values, offsets, weights}};
    ASSERT_TRUE(recorded && (*recorded)->apply(1, samples) && (*recorded)->commit()) << step;
    clock->setDay(1);
    if (step[0] == 'i') store()->TBClientCheckpoint();
  }
  const std::string whole = get("data/TBDataStore.sqlitedb");
  std::minstd_rand random(11);
  for (int round = 0; round < 120; ++round) {
    std::string spoiled = whole;
    for (int i = 0; i < 12; ++i) spoiled[random() % whole.size()] = static_cast<char>(random());
    if (round % 3 == 0) spoiled.resize(random() % whole.size());
    for (const auto& file : names("data")) std::filesystem::remove(at("data/" + file));
    put("data/TBDataStore.sqlitedb", spoiled);
    EXPECT_LE(scalars().size(), 41u);
    (void)lengths();
    store()->TBClientCheckpoint();
    listStoreKeys(
        storeFile, [](const StoreKey&) {}, [](const std::string&) {});
  }
}

}  // namespace
}  // namespace tally
