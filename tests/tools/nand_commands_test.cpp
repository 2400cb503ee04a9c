// tallyctl nand: what it shows of a driver's figures, and its exit statuses.
#include "tools/nand_tool.h"

namespace tally::tools {
namespace {

using fakes::Record;
using testing::HasSubstr;
using testing::Not;

class NandCommands : public NandToolTest {
 protected:
  NandCommands() {
    storage.purgeableSpace->answer =
        KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", KvNumber::int64(5)},
                              {"RECLAIM_NONPURGEABLE_AMOUNT", KvNumber::int64(6)}});
  }
  // Runs on a device whose driver exports these records; none: a device without a driver.
  Outcome runOn(const std::vector<std::string>& arguments, std::vector<Record> records) {
    fakes::FakeStorageRegistry& registry = *storage.registry;
    registry.classes = fakes::FakeStorageRegistry().classes;
    if (records.empty()) registry.classes.clear();
    records.insert(records.begin(), {53, {0x20002}});
    registry.serve(fakes::statisticsBuffer(records));
    return nand(arguments);
  }
};

constexpr std::uint32_t kSpareAvailable = 532, kUserPartitionUsed = 431, kReads = 7, kHisto = 327,
                        kHostReadErrors = 172;

TEST_F(NandCommands, InfoInGroups) {
  const Outcome info = runOn({"info"}, {{kReads, {1'234'567}}, {kHisto, {1, 9, 3}}, {121, {5, 6}}});
  EXPECT_EQ(info.status, kSuccess);
  for (const char* line : {"Device\n", "NumLogicalReads", "1,234,567", "BandsMaxTempHisto0-2",
                           "1 9 3", "ReadsBeforeErasure50000", "PadSize1-2"}) {
    EXPECT_THAT(info.out, HasSubstr(line));
  }
  EXPECT_THAT(info.out, Not(HasSubstr("vellum.NANDInfo")));
  EXPECT_THAT(info.err, HasSubstr("VMFreezer NAND writes"));

  const Outcome some = runOn({"info", "Histo"}, {{kReads, {1}}, {kHisto, {1, 9, 3}}});
  EXPECT_THAT(some.out, HasSubstr("BandsMaxTempHisto0-2"));
  EXPECT_THAT(some.out, Not(HasSubstr("NumLogicalReads")));
  EXPECT_EQ(runOn({"info", "no such"}, {{kReads, {1}}}).status, kWrong);
}

TEST_F(NandCommands, HealthDecidesTheStatus) {
  const struct {
    std::vector<Record> records;
    int status;
    const char* says;
  } cases[] = {
      {{{kSpareAvailable, {98}}, {kUserPartitionUsed, {9}}}, kSuccess, "98 %"},
      {{{kSpareAvailable, {2}}}, kWrong, "should be retired"},
      // A group of which nothing is exported is no wear of 0; one counter of it is enough.
      {{{kReads, {1}}}, kSuccess, "Wear, most used part              not exported"},
      {{{kHostReadErrors, {7}}}, kSuccess, "Host read errors                             7"},
      {{}, kWrong, ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.says);
    const Outcome health = runOn({"health"}, c.records);
    EXPECT_EQ(health.status, c.status);
    EXPECT_THAT(health.out, HasSubstr(c.says));
    const Outcome json = runOn({"health", "--json"}, c.records);
    EXPECT_EQ(json.status, c.status);
    EXPECT_EQ(json.out.empty(), c.records.empty());
  }
  EXPECT_EQ(runOn({"wealth"}, {}).status, kBadUsage);
}

TEST_F(NandCommands, EventsAreShownAndNotSent) {
  const Outcome events = runOn({"events"}, {{kReads, {1'234'567}}});
  EXPECT_EQ(events.status, kSuccess);
  EXPECT_THAT(events.out, HasSubstr("1,234,567"));
  EXPECT_THAT(events.out, HasSubstr("35 events, 35 of them wanted; nothing was sent."));
  EXPECT_THAT(events.out, HasSubstr("to the metrics store"));
  const Outcome some = runOn({"events", "NANDInfo_6", "--json"}, {{41, {9}}});
  const auto json = some.json();
  EXPECT_EQ(json["serviceAvailable"], true);
  ASSERT_EQ(json["events"].size(), 1u);
  EXPECT_EQ(json["events"][0]["payload"]["clogProgram"], 9);
  EXPECT_EQ(runOn({"events", "no such"}, {}).status, kWrong);

  storage.analyticsEvents->available = false;
  storage.analyticsEvents->offered.clear();
  EXPECT_EQ(nand({"events"}).status, kWrong);
  EXPECT_TRUE(storage.analyticsEvents->offered.empty());
}

}  // namespace
}  // namespace tally::tools
