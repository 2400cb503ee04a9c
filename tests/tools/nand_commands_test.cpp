// tallyctl nand: what it shows of a driver's figures, lists and snapshots, and its exit statuses.
#include <algorithm>

#include "fakes/fake_storage.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using fakes::appendValue;
using fakes::Bytes;
using fakes::Record;
using testing::HasSubstr;
using testing::Not;

// On a storage driver in memory.
class NandToolTest : public ToolTest {
 protected:
  Platform makePlatform(const std::string&, std::FILE*) override { return storage.services(); }
  Outcome nand(const std::vector<std::string>& arguments) {
    testing::internal::CaptureStderr();
    testing::internal::CaptureStdout();
    const Outcome outcome = runUnder({"nand"}, arguments);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "") << "the library's notices spoil JSON";
    testing::internal::GetCapturedStderr();
    return outcome;
  }
  fakes::FakeStorage storage;
};

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
  expectParts(info.out, {"Device\n", "NumLogicalReads", "1,234,567", "BandsMaxTempHisto0-2",
                         "1 9 3", "ReadsBeforeErasure50000", "PadSize1-2"});
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
}

TEST_F(NandCommands, EventsAreShownAndNotSent) {
  const Outcome events = runOn({"events"}, {{kReads, {1'234'567}}});
  EXPECT_EQ(events.status, kSuccess);
  expectParts(events.out, {"1,234,567", "35 events, 35 of them wanted; nothing was sent.",
                           "to the metrics store"});
  expectValues(
      runOn({"events", "NANDInfo_6", "--json"}, {{41, {9}}}).json(),
      R"({"/serviceAvailable": true, "/events/0/payload/clogProgram": 9, "/events/1": "absent"})");
  EXPECT_EQ(runOn({"events", "no such"}, {}).status, kWrong);

  storage.analyticsEvents->available = false;
  storage.analyticsEvents->offered.clear();
  EXPECT_EQ(nand({"events"}).status, kWrong);
  EXPECT_TRUE(storage.analyticsEvents->offered.empty());
}

Bytes listOf(const std::vector<std::uint32_t>& words) {
  Bytes bytes;
  for (const std::uint32_t word : words) appendValue(bytes, word);
  return bytes;
}

class NandListCommandsTest : public NandToolTest {
 protected:
  NandListCommandsTest() {
    storage.registry->properties["Device Characteristics"] =
        KvDictionary::create({{"chip-id", KvString::create("Q7M")},
                              {"manufacturer-id", KvString::create("x")},
                              {"num-bus", KvNumber::int32(2)}});
  }
  void serveTelemetry(std::size_t modes) {
    Bytes list(2 * 4128);
    list[4] = std::byte{42};  // the second counter of the first bus
    for (std::size_t mode = 0; mode < modes; ++mode) storage.registry->serveNext(list);
  }
  const Bytes statistics =
      fakes::statisticsBuffer({{53, {1}}, {20, {180}}, {50, {256}}, {49, {16384}}, {4, {102400}}});
  const Bytes validity = listOf({2, 0, 0, 3, 70, 0, 0, 0, 3, 71, 0, 0, 0});
  const Bytes defects = listOf({0, 41, 1, 0x20001, 3, 4, 5, 6, 7, 30, 0});
};

TEST_F(NandListCommandsTest, ListsForPeopleAndForPrograms) {
  serveTelemetry(3);
  expectParts(nand({"telemetry"}).out, {"Mode 2, bus 1", "readStage[0-22]", "0 42 0"});
  serveTelemetry(1);  // an invalid digit would not be valid JSON
  expectValues(nand({"telemetry", "--mode", "1", "--json"}).json(),
               R"({"/0/mode": 1, "/1": "absent",
      "/0/buses/0/readStage/1": 42, "/0/buses/1/readStage/1": 0, "/0/buses/2": "absent"})");
  EXPECT_EQ(nand({"telemetry", "--mode", "3"}).status, kBadUsage);
  const struct {
    const char* command;
    Bytes list;
    const char *text, *values;
  } cases[] = {
      {"validity", validity, "70 71", R"({"": {"ValidityList[3]": [70, 71]}})"},
      {"defects", defects, "41 of the factory, 1 found since",
       R"({"/summary/Factory Count": 41, "/defects/0/CE": 2})"},
  };
  for (const auto& c : cases) {
    storage.registry->serve(c.list);
    EXPECT_THAT(nand({c.command}).out, HasSubstr(c.text));
    storage.registry->serve(c.list);
    expectValues(nand({c.command, "--json"}).json(), c.values);
  }
}

TEST_F(NandListCommandsTest, ThePreviewOfTheLogChangesNothing) {
  const struct {
    double sinceLast, threshold;
    bool written;
  } cases[] = {{700000, 1.5, true}, {600000, 1.5, false}, {700000, 5, false}};
  const auto serve = [this] {
    storage.registry->replies.clear();
    for (const Bytes& list : {statistics, validity, statistics}) storage.registry->serveNext(list);
    serveTelemetry(3);
    storage.registry->serveNext(defects);
  };
  for (const auto& c : cases) {
    auto& preferences = *storage.platform.preferences;
    preferences.put("SSLastLoggedAt", KvDate::create(storage.platform.clock->now - c.sinceLast),
                    "vellum.tallyd.tallyrun");
    preferences.put("userWAmp", KvNumber::float64(c.threshold), "vellum.NANDInfo");
    storage.platform.calls->clear();
    serve();
    const Outcome text = nand({"storage-log", "--preview"});
    EXPECT_THAT(text.out, HasSubstr("UserWamp:1.80;"));
    EXPECT_EQ(text.out.find("Next one from") != std::string::npos, c.sinceLast < 604800);
    serve();
    const nlohmann::json preview = nand({"storage-log", "--preview", "--json"}).json();
    EXPECT_EQ(preview["wouldBeWritten"], c.written);
    EXPECT_EQ(preview["structuredRecords"], 3 * 2 + 2);
    EXPECT_THAT(preview["text"].get<std::string>(), HasSubstr("ValidityList[3]:70,71\n"));
    EXPECT_TRUE(storage.platform.calls->empty()) << "every change of a preference is recorded";
    EXPECT_TRUE(storage.platform.logSubmission->logs.empty());
  }
}

class SnapshotCommand : public ToolTest {
 protected:
  std::string file(const char* name, const std::string& bytes) const {
    put(name, bytes);
    return at(name);
  }
  Outcome show(const std::vector<std::string>& arguments) {
    return runUnder({"nand", "snapshot"}, arguments);
  }
};

TEST_F(SnapshotCommand, ShowsRecordsOfBothLayouts) {
  const std::string record = "\x07" + std::string(251, '\0');
  std::string many;  // more text than the first try has space for
  for (int i = 0; i < 9000; ++i) many += record;
  const Outcome fixed = show({file("fixed", many)});
  EXPECT_EQ(fixed.status, kSuccess);
  EXPECT_TRUE(fixed.out.starts_with("Key: \nT   - Timestamp\n"));
  EXPECT_EQ(std::count(fixed.out.begin(), fixed.out.end(), '\n'), 27 + 9000 + 1);
  const Outcome cut = show({file("cut", record + "x")});
  EXPECT_EQ(cut.status, kSuccess);
  EXPECT_THAT(cut.err, HasSubstr("does not end with a whole record"));

  const auto words = [](std::initializer_list<std::uint32_t> values) {
    return std::string(reinterpret_cast<const char*>(values.begin()), 4 * values.size());
  };
  const auto block = [&](const std::string& label) {
    std::string bytes = words({0, 6, 4, 3, 0, 0, 36, 0, 0x5d1b, 1, 0, 0, 0, 4}) + label;
    bytes.resize(36 + 8 + 28);
    return bytes;
  };
  const std::string records = file("records", words({5, 77}));
  const std::string good = file("good", block("T=%04u")), bad = file("bad", block("T=%n"));
  const Outcome described = show({records, "--header", good});
  EXPECT_EQ(described.status, kSuccess);
  EXPECT_EQ(described.out, "- SPX Snapshot - \n\\x1b]\nT=0005\nT=0077\n");
  const Outcome json = show({records, "--header", good, "--json"});
  EXPECT_EQ(json.json()["lines"][3], "T=0077");
  const Outcome refused = show({records, "--header", bad});
  EXPECT_EQ(refused.status, kWrong);
  EXPECT_THAT(refused.err, HasSubstr("a label format holds anything but one integer"));
  EXPECT_EQ(show({"/nowhere"}).status, kWrong);
}

}  // namespace
}  // namespace tally::tools
