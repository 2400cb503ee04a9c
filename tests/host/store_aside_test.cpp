// Stores of newer versions of the program: nothing of them is lost, and recording goes on.
#include <sys/wait.h>
#include <unistd.h>

#include "host/store/recording/recording_store.h"
#include "host/store/store_aside.h"
#include "host/store_fixture.h"

namespace tally {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class NewerStoreTest : public StoreTest {
 protected:
  NewerStoreTest() {
    storeFile.notify = [this](const std::string& message) { notices.push_back(message); };
  }
  // As a newer program leaves it: with a table that is not known here, and its last commit in the
  // log only.
  void makeNewer(const std::string& value) const {
    std::filesystem::create_directories(at("data"));
    const int child = ::fork();
    if (child == 0) {
      sqlite3* handle = nullptr;
      ::sqlite3_open(path.c_str(), &handle);
      ::sqlite3_exec(handle, "PRAGMA journal_mode = WAL", nullptr, nullptr, nullptr);
      const std::string text =
          "BEGIN; CREATE TABLE later(value); INSERT INTO later VALUES ('" + value +
          "'); PRAGMA application_id = 1413629011; PRAGMA user_version = 999; COMMIT";
      const int done = ::sqlite3_exec(handle, text.c_str(), nullptr, nullptr, nullptr);
      ::_exit(done);
    }
    int status = -1;
    ::waitpid(child, &status, 0);
    ASSERT_EQ(status, 0);
    ASSERT_GT(std::filesystem::file_size(path + "-wal"), 0U);
  }
  std::string valueIn(const std::string& file) {
    path = file;
    return sql("SELECT value FROM later");
  }
  std::vector<std::string> notices;
};

TEST_F(NewerStoreTest, IsKeptByEveryWriterAndNoReader) {
  const struct {
    const char* name;
    std::function<void()> write;
  } writers[] = {
      {"the checkpoint of the daily job", [&] { store()->TBClientCheckpoint(); }},
      {"the sweep of the daily job", [&] { store()->TBClientSetValueForScalarKey("a", 1); }},
      {"the recorder",
       [&] { EXPECT_TRUE(makeSqliteRecordingStore(storeFile)->newestDay()) << "fails"; }},
      {"a command", [&] { EXPECT_TRUE(set(kToday, "a", 1)); }},
  };
  std::uint32_t number = 0;
  for (const auto& writer : writers) {
    SCOPED_TRACE(writer.name);
    for (const char* end : {"", "-wal", "-shm"}) std::filesystem::remove(path + end);
    makeNewer(writer.name);
    EXPECT_THAT(scalars(), IsEmpty());
    EXPECT_THAT(errors(), ElementsAre(AllOf(HasSubstr(path), HasSubstr("newer version"))));
    EXPECT_THAT(notices, IsEmpty());
    useBoundedLog();
    writer.write();
    EXPECT_THAT(errors(), IsEmpty());
    const std::string aside = path + ".newer-" + std::to_string(++number);
    EXPECT_THAT(notices, ElementsAre(AllOf(HasSubstr("schema 999"), HasSubstr("newer-"))));
    notices.clear();
    EXPECT_TRUE(set(kToday, "b", 2));
    EXPECT_EQ(scalars("b").size(), 1U);
    EXPECT_THAT(notices, IsEmpty());
    const std::string former = path;
    EXPECT_EQ(valueIn(aside), writer.name);
    path = former;
  }
  ASSERT_EQ(storesSetAside(storeFile).size(), std::size(writers));
}

TEST_F(NewerStoreTest, StaysWhileItsProgramHasItOpen) {
  makeNewer("open");
  sqlite3* handle = nullptr;
  ASSERT_EQ(::sqlite3_open(path.c_str(), &handle), SQLITE_OK);
  ASSERT_EQ(::sqlite3_exec(handle, "SELECT * FROM later", nullptr, nullptr, nullptr), SQLITE_OK);
  runTogether(1, 1, [this](int, int) { return !set(kToday, "a", 1); });
  EXPECT_THAT(storesSetAside(storeFile), IsEmpty());
  ::sqlite3_close(handle);
  EXPECT_TRUE(set(kToday, "a", 1));
  EXPECT_EQ(storesSetAside(storeFile).size(), 1U);
}

TEST_F(NewerStoreTest, SeveralWritersSetItAsideOnceAndLoseNothing) {
  constexpr int kWriters = 6;
  makeNewer("shared");
  runTogether(kWriters, 1, [this](int number, int) {
    return set(kToday, "key" + std::to_string(number), number);
  });
  EXPECT_EQ(scalars().size(), static_cast<std::size_t>(kWriters));
  ASSERT_EQ(storesSetAside(storeFile).size(), 1U);
  EXPECT_EQ(valueIn(path + ".newer-1"), "shared");
}

}  // namespace
}  // namespace tally
