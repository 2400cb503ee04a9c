// The exporter table, connections, the fetch and the content-deletion query, with every call
// failing once. What is printed is compared to the letter.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <bit>

#include "fakes/fake_storage.h"
#include "storage/exporter.h"
#include "storage/texts.h"

namespace tally {
namespace {

using fakes::Bytes;
using fakes::statisticsBuffer;
using testing::ElementsAre;
using testing::IsEmpty;
using Calls = std::vector<std::string>;

constexpr char kNvme[] = "OrreryEmbeddedNVMeController";
const Bytes kBuffer = statisticsBuffer({{53, {2}}, {7, {11}}});  // 32 bytes
const Calls kFetch = {"find SPXStorage", "open 7 type 0", "call 8 in 24 13 1 room 4",
                      "call 8 in 24 13 room 32", "close 9"};
const Calls kUnopened = {"find SPXStorage", "open 7 type 0"};
constexpr char kNotOpened[] = "Could not get connection to service\nfalse";
constexpr char kNotClosed[] = "Could not close connection to service\n";
using Replies = std::deque<fakes::FakeStorageRegistry::Reply>;

class StorageConnectionTest : public testing::Test {
 protected:
  // What a run prints, "false" after a failure; nothing may stay open.
  template <class Run>
  std::string printed(const Run& run) {
    const std::string errors = tests::errorsOf(run);
    EXPECT_EQ(storage.registry->services, 0);
    EXPECT_EQ(storage.registry->connections, 0);
    return errors;
  }
  void answer(const Replies& replies, RegistryResult openStatus, RegistryResult closeStatus) {
    registry.calls.clear();
    registry.replies = replies;
    registry.openStatus = openStatus;
    registry.closeStatus = closeStatus;
  }
  fakes::FakeStorage storage;
  fakes::FakeStorageRegistry& registry = *storage.registry;
};

TEST_F(StorageConnectionTest, TheFirstKnownClassIsTaken) {
  const std::pair<std::set<std::string>, std::size_t> cases[] = {
      {{"SPXStorage", kNvme}, 0}, {{kNvme, "Other"}, 1}, {{"Other"}, 2}};
  for (const auto& [classes, index] : cases) {
    registry.classes = classes;
    const NandExporter* exporter = nullptr;
    EXPECT_EQ(findNandExporter(&exporter) != 0, index < 2);
    EXPECT_EQ(exporter, &nand_exporters[index]);
  }
}

TEST_F(StorageConnectionTest, Fetch) {
  const Bytes size{std::byte{32}, std::byte{0}, std::byte{0}, std::byte{0}};
  Bytes longer = kBuffer;
  longer.resize(100);
  const Bytes torn(kBuffer.begin(), kBuffer.begin() + 24);
  Calls withoutData = kFetch, withoutRoom = kFetch;
  withoutData.erase(withoutData.begin() + 3);
  withoutRoom[3] = "call 8 in 24 13 room 0";
  const std::string noData = "Could not retrieve data from driver for selector d\n";
  const struct {
    const char* name;
    Replies replies;
    std::string printed = "";
    Calls calls = kFetch;
    RegistryResult openStatus = 0, closeStatus = 0;
  } cases[] = {
      {"all well", {{size}, {kBuffer}}},
      {"cut in a record", {{size}, {torn}}, "false"},
      {"says more than announced", {{size}, {longer}}},
      {"no size at all", {{Bytes{}}, {kBuffer}}, "false", withoutRoom},
      {"no connection", {}, kNotOpened, kUnopened, 5},
      {"size query",
       {{size, 0xE00002C2}},
       "HwConnectCallStructMethod: -536870206false",
       withoutData},
      {"data call", {{size}, {kBuffer, 1}}, noData + "false"},
      {"close", {{size}, {kBuffer}}, kNotClosed, kFetch, 0, 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    answer(c.replies, c.openStatus, c.closeStatus);
    const NandExporter* exporter = nullptr;
    SPXParseContext context;
    EXPECT_EQ(printed([&] { return loadNandStatistics(&exporter, &context)->value(); }), c.printed);
    EXPECT_EQ(registry.calls, c.calls);
    EXPECT_EQ(exporter, &nand_exporters[0]);
    const bool result = !c.printed.ends_with("false");
    EXPECT_EQ(context.hostReads, result ? 11u : 0u);
    EXPECT_EQ(context.firstBlock != nullptr, result);  // nothing is left by a failure
    SPXReleaseContext(&context);
  }
}

TEST_F(StorageConnectionTest, WithoutADriver) {
  registry.classes.clear();
  const NandExporter* exporter = nullptr;
  SPXParseContext context;
  const std::string noService = "Could not get matching HwKit service for exporting classes\nfalse";
  EXPECT_EQ(printed([&] { return loadNandStatistics(&exporter, &context)->value(); }), noService);
  EXPECT_EQ(exporter, &nand_exporters[2]);
  EXPECT_EQ(printed([] { return NandRecommendsContentDeletion()->value(); }),
            "_load_nand_info" + noService);
  EXPECT_EQ(printed([&] { return FNDConnect(&exporter) != 0; }), "No class foundfalse");
  SPXConnection connection;
  EXPECT_EQ(printed([&] { return openSPXConnection(&connection) != 0; }),
            "Can't get SPX Connection, no matching service!\nfalse");
  EXPECT_THAT(registry.calls, IsEmpty());
}

TEST_F(StorageConnectionTest, ContentDeletion) {
  const Bytes yes = {std::byte{}, std::byte{}, std::byte{}, std::byte{1}};
  Bytes late(4);  // says yes after the four bytes that count
  late.insert(late.end(), yes.begin(), yes.end());
  const struct {
    Replies replies;
    std::string printed;
    RegistryResult openStatus = 0, closeStatus = 0;
    Calls calls = {"find SPXStorage", "open 7 type 0", "call 5 in 0 room 4", "close 9"};
    const char* className = "SPXStorage";
  } cases[] = {
      {{{yes}}, ""},
      {{{late}}, "false"},
      {{{yes, 1}}, "false"},
      {{{yes}}, kNotClosed, 0, 1},
      {{}, kNotOpened, 1, 0, kUnopened},
      {{{yes}}, "false", 0, 0, {std::string("find ") + kNvme}, kNvme},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(&c - cases);
    answer(c.replies, c.openStatus, c.closeStatus);
    registry.classes = {c.className};
    EXPECT_EQ(printed([] { return NandRecommendsContentDeletion()->value(); }), c.printed);
    EXPECT_EQ(registry.calls, c.calls);
  }
}

TEST_F(StorageConnectionTest, OpenConnections) {
  SPXConnection connection;
  EXPECT_EQ(openSPXConnection(&connection), 1);
  EXPECT_NE(connection.service, 0u);
  EXPECT_NE(connection.connection, 0u);
  closeSPXConnection(&connection);
  EXPECT_EQ(connection.connection, 0u);

  registry.openStatus = 0xE00002C5;
  EXPECT_EQ(printed([&] { return openSPXConnection(&connection) != 0; }),
            "HwServiceOpen failed for class 'SPXStorage', result 0xe00002c5\n"
            "Can't get SPX Connection!\nfalse");
  registry.openStatus = 0;
  registry.closeStatus = 1;
  const NandExporter* exporter = nullptr;
  EXPECT_EQ(printed([&] { return FNDDisconnect(FNDConnect(&exporter)), true; }),
            "closing connection to service failed\n");
}

}  // namespace
}  // namespace tally
