// tallyctl nand: what it shows of a driver's figures, lists and snapshots, and its exit statuses.
#include <algorithm>

#include "fakes/fake_storage.h"
#include "tools/storage/wear_forecast.h"
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

TEST(WearForecast, TheBoundsComeFromTheRangesOfTheSteps) {
  const auto row = [](std::int32_t day, unsigned least, unsigned most,
                      std::optional<std::int64_t> host = {},
                      std::optional<std::int64_t> flash = {}) {
    return WearRow{day, {least, most}, host, flash};
  };
  const struct {
    const char* name;
    std::vector<WearRow> history;
    WearRow now;
    std::size_t steps;
    std::optional<Estimate> perDay, endDay;
    std::optional<double> bytesPerDay = {}, amplification = {};
  } cases[] = {
      {"nothing before", {}, row(100, 3, 3), 0, {}, {}},
      {"one step", {row(0, 0, 10, 100, 300)}, row(100, 10, 20, 300, 800), 1, {}, {}, 2, 2.5},
      {"two steps",
       {row(0, 0, 10), row(100, 10, 20), row(190, 10, 20)},
       row(200, 20, 30),
       2,
       Estimate{10.0 / 200, 0.1, 20.0 / 100},
       Estimate{200 + 70 / 0.2, 1000, 200 + 80 / 0.05}},
      {"whole percents",
       {row(0, 1, 1), row(10, 2, 2)},
       row(20, 3, 3),
       2,
       Estimate{1.0 / 20, 0.1, 0.2},
       Estimate{20 + 96 / 0.2, 990, 20 + 97 / 0.05}},
      {"a fall begins anew, days to come do not count",
       {row(0, 50, 60), row(10, 60, 70), row(20, 70, 80), row(30, 0, 10), row(500, 90, 100)},
       row(40, 10, 20),
       1,
       {},
       {}},
      {"used up",
       {row(0, 80, 90), row(10, 90, 100)},
       WearRow{20, {100, {}}, {}, {}},
       2,
       Estimate{0.5, 1, 1.1},
       {}},
      {"counters that fell", {row(0, 0, 10, 500, 500)}, row(10, 0, 10, 100, 200), 0, {}, {}, {}, 2},
  };
  const auto expectNear = [](const std::optional<Estimate>& got,
                             const std::optional<Estimate>& want) {
    ASSERT_EQ(got.has_value(), want.has_value());
    if (!got) return;
    EXPECT_NEAR(got->least, want->least, 1e-6);
    EXPECT_NEAR(got->likely, want->likely, 1e-6);
    EXPECT_NEAR(got->most, want->most, 1e-6);
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const WearForecast forecast = forecastOf(wearSeries(c.history, c.now));
    EXPECT_EQ(forecast.steps, c.steps);
    expectNear(forecast.perDay, c.perDay);
    expectNear(forecast.endDay, c.endDay);
    EXPECT_EQ(forecast.bytesPerDay, c.bytesPerDay);
    EXPECT_EQ(forecast.writeAmplification, c.amplification);
  }
}

class NandDevices : public ToolTest {
 protected:
  Outcome nand(const std::vector<std::string>& arguments) { return runUnder({"nand"}, arguments); }
};

TEST_F(NandDevices, ListsDisksAndReadsTheChosenOne) {
  for (const auto& [name, lifeTime] :
       {std::pair("mmcblk0", "0x01 0x03"), {"mmcblk1", "0x0b 0x0b"}}) {
    const std::string folder = std::string("device/sys/block/") + name + "/device/";
    put(folder + "type", "MMC\n");
    put(folder + "life_time", lifeTime + std::string("\n"));
    put(folder + "cid", std::string("serial") + name);
  }
  put("device/sys/block/mmcblk0/dev", "179:0");
  put("device/proc/self/mountinfo", "1 0 179:0 / / rw - ext4 /dev/root rw\n");
  put("device/proc/uptime", "200000.5 1");
  const Outcome devices = nand({"devices"});
  EXPECT_EQ(devices.status, kSuccess);
  expectParts(devices.out, {"mmcblk0  eMMC  20-30 %", "2 days ago  the device's storage",
                            "mmcblk1  eMMC  100 % or more"});
  EXPECT_THAT(devices.out, Not(HasSubstr("serial")));
  expectValues(nand({"devices", "--json"}).json(),
               R"({"/0/isStorage": true, "/0/wear/used/value/most": 30, "/1/isStorage": false,
                   "/1/wear/used/value/most": null, "/1/wear/spare": "absent"})");
  expectParts(nand({"health"}).out, {"Wear, most used part                      20 %",
                                     "Not enough history for a forecast: 0 of the 2 steps"});
  const Outcome other = nand({"health", "--device", "mmcblk1", "--json"});
  expectValues(other.json(), R"({"/wear/device": "mmcblk1", "/wear/steps": 0,
      "/health/vellum.NANDInfo.Health.MaxPercentageNANDUsed": 100})");
  EXPECT_EQ(nand({"health", "--device", "sda"}).status, kWrong);
  putList(kRegistry, R"({"Entries": [{"Class": "OrreryEmbeddedNVMeController"}]})");
  EXPECT_EQ(nand({"devices"}).status, kWrong) << "the description comes first";
}

}  // namespace
}  // namespace tally::tools
