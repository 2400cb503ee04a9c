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
  fakes::FakeStorage storage;
  fakes::FakeStorageRegistry& registry = *storage.registry;
};

TEST_F(StorageConnectionTest, TheFirstKnownClassIsTaken) {
  const struct {
    std::set<std::string> classes;
    std::size_t exporter;
  } cases[] = {{{"SPXStorage", kNvme}, 0}, {{kNvme, "Other"}, 1}, {{"Other"}, 2}};
  for (const auto& c : cases) {
    registry.classes = c.classes;
    const NandExporter* exporter = nullptr;
    const std::uint32_t service = findNandExporter(&exporter);
    EXPECT_EQ(exporter, &nand_exporters[c.exporter]);
    EXPECT_EQ(service != 0, exporter->className != nullptr);
  }
}

TEST_F(StorageConnectionTest, Fetch) {
  const Bytes size{std::byte{32}, std::byte{0}, std::byte{0}, std::byte{0}};
  Bytes longer = kBuffer;
  longer.resize(100);
  const Bytes torn(kBuffer.begin(), kBuffer.begin() + 24);
  const Calls untilOpen(kFetch.begin(), kFetch.begin() + 2);
  Calls withoutData = kFetch, withoutRoom = kFetch;
  withoutData.erase(withoutData.begin() + 3);
  withoutRoom[3] = "call 8 in 24 13 room 0";
  const std::string noSize = "HwConnectCallStructMethod: -536870206";
  const std::string noData = "Could not retrieve data from driver for selector d\n";
  const std::string notClosed = "Could not close connection to service\n";
  const struct {
    const char* name;
    std::deque<fakes::FakeStorageRegistry::Reply> replies;
    bool result;
    Calls calls = kFetch;
    std::uint64_t hostReads = 0;
    std::string printed = {};
    RegistryResult openStatus = 0, closeStatus = 0;
  } cases[] = {
      {"all well", {{size}, {kBuffer}}, true, kFetch, 11},
      {"cut in a record", {{size}, {torn}}, false},
      {"says more than announced", {{size}, {longer}}, true, kFetch, 11},
      {"no size at all", {{Bytes{}}, {kBuffer}}, false, withoutRoom},
      {"no connection", {}, false, untilOpen, 0, "Could not get connection to service\n", 5},
      {"size query", {{size, 0xE00002C2}}, false, withoutData, 0, noSize},
      {"data call", {{size}, {kBuffer, 1}}, false, kFetch, 0, noData},
      {"close", {{size}, {kBuffer}}, true, kFetch, 11, notClosed, 0, 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    registry.calls.clear();
    registry.replies = c.replies;
    registry.openStatus = c.openStatus;
    registry.closeStatus = c.closeStatus;
    const NandExporter* exporter = nullptr;
    SPXParseContext context;
    EXPECT_EQ(printed([&] { return loadNandStatistics(&exporter, &context)->value(); }),
              c.printed + (c.result ? "" : "false"));
    EXPECT_EQ(registry.calls, c.calls);
    EXPECT_EQ(exporter, &nand_exporters[0]);
    EXPECT_EQ(context.hostReads, c.hostReads);
    EXPECT_EQ(context.firstBlock != nullptr, c.result);  // nothing is left behind by a failure
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
  const Calls unopened = {"find SPXStorage", "open 7 type 0"};
  const struct {
    fakes::FakeStorageRegistry::Reply reply;
    bool answer;
    std::string printed = {};
    RegistryResult openStatus = 0, closeStatus = 0;
    Calls calls = {"find SPXStorage", "open 7 type 0", "call 5 in 0 room 4", "close 9"};
    const char* className = "SPXStorage";
  } cases[] = {
      {{yes}, true},
      {{late}, false},
      {{yes, 1}, false},
      {{yes}, true, "Could not close connection to service\n", 0, 1},
      {{}, false, "Could not get connection to service\n", 1, 0, unopened},
      {{yes}, false, "", 0, 0, {std::string("find ") + kNvme}, kNvme},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(&c - cases);
    registry.calls.clear();
    registry.classes = {c.className};
    registry.replies = {c.reply};
    registry.openStatus = c.openStatus;
    registry.closeStatus = c.closeStatus;
    EXPECT_EQ(printed([&] { return NandRecommendsContentDeletion()->value(); }),
              c.printed + (c.answer ? "" : "false"));
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
