// Structured-data logs and the rolling of logs across kills and damage.
#include "host/spool/structured_data.h"

#include "host/linux_platform.h"
#include "host/spool/crash_reporting.h"
#include "host/temporary_root.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

using Names = std::vector<std::string>;

class StructuredDataTest : public TemporaryRoot {
 protected:
  Status append(std::uint32_t type, std::int64_t value) {
    return data.append(type, *KvDictionary::create({{"n", KvNumber::int64(value)}}), bounds);
  }
  Names finish() {
    Names failures;
    data.finishAll(bounds, [&](const Error& error) { failures.push_back(error.message); });
    return failures;
  }
  // The values of the records in all finished logs, in order; also checks each one's type.
  std::vector<std::int64_t> finished(std::int64_t type) {
    std::vector<std::int64_t> values;
    for (const std::string& name : names("data")) {
      if (!name.ends_with(".plist")) continue;
      const auto document = decodePlist(get("data/" + name));
      EXPECT_TRUE(document) << name;
      const auto* entries = kvCast<KvDictionary>(document->get());
      if (entries->getInt64("RecordType") != type) continue;
      for (const auto& item : *entries->getAs<KvArray>("Records")) {
        values.push_back(*kvCast<KvDictionary>(item.get())->getInt64("n"));
      }
    }
    return values;
  }

  fakes::FakeClock clock;
  StructuredDataFolder data{folder("data"), clock, *log};
  FolderBounds bounds;
};

TEST_F(StructuredDataTest, RecordsAreGatheredByTypeAndWrittenOutOnce) {
  EXPECT_TRUE(finish().empty());
  EXPECT_FALSE(exists("data")) << "made without need";
  for (int i = 1; i <= 3; ++i) ASSERT_TRUE(append(172, i));
  ASSERT_TRUE(append(176, 9));
  EXPECT_EQ(names("data"), (Names{"0000000001-172.pending", "0000000002-176.pending"}));
  EXPECT_TRUE(finish().empty());
  EXPECT_TRUE(finish().empty());
  ASSERT_TRUE(append(172, 4));
  EXPECT_EQ(names("data"),
            (Names{"0000000001-172.plist", "0000000002-176.plist", "0000000003-172.pending"}));
  EXPECT_TRUE(finish().empty());
  EXPECT_EQ(finished(172), (std::vector<std::int64_t>{1, 2, 3, 4}));
  EXPECT_EQ(finished(176), std::vector<std::int64_t>{9});
  bounds.maximumLogs = 1;
  ASSERT_TRUE(append(176, 10));
  ASSERT_TRUE(append(172, 11));
  EXPECT_EQ(finish(), Names{}) << "the first log took the second one's place";
  EXPECT_EQ(names("data"), Names{"0000000005-172.plist"});
}

TEST_F(StructuredDataTest, TornAndDamagedRecordsCostOnlyThemselves) {
  ASSERT_TRUE(append(172, 1));
  const std::string whole = get("data/0000000001-172.pending");
  EXPECT_EQ(wholeRecords(whole), whole.size());
  for (const std::string& torn : std::vector<std::string>{
           "0", "0000000099", "0000000099\nabc", "9999999999\n", "-000000001\n", "garbage garbage",
           "0000000003\n<" + std::string(1, '\0') + ">\n"}) {
    EXPECT_EQ(wholeRecords(whole + torn), whole.size()) << torn;
  }
  for (std::size_t cut = 0; cut < whole.size(); ++cut) {
    EXPECT_EQ(wholeRecords(whole.substr(0, cut)), 0u) << cut;
  }
  put("data/0000000001-172.pending", whole + "0000000300\nhalf a rec");
  ASSERT_TRUE(append(172, 2));
  put("data/0000000001-172.pending",
      get("data/0000000001-172.pending") + "0000000003\nbad\n" + whole);
  const auto failures = finish();
  ASSERT_EQ(failures.size(), 1u);
  EXPECT_NE(failures[0].find("1 damaged"), std::string::npos) << failures[0];
  EXPECT_EQ(finished(172), (std::vector<std::int64_t>{1, 2, 1}));
  std::filesystem::create_directories(at("data/0000000007-172.pending"));
  ASSERT_TRUE(append(172, 3));
  EXPECT_EQ(finish().size(), 1u);
  EXPECT_EQ(finished(172), (std::vector<std::int64_t>{1, 2, 1, 3}));
}

TEST_F(StructuredDataTest, LogsRollThroughSevenGenerations) {
  EXPECT_TRUE(rollLogs(folder("absent")));
  put("logs/empty.log", "");
  put("logs/other.txt", "x");
  for (int i = 1; i <= 9; ++i) {
    put("logs/a.log", std::to_string(i));
    ASSERT_TRUE(rollLogs(folder("logs")));
  }
  EXPECT_EQ(names("logs"), (Names{"a.log.1", "a.log.2", "a.log.3", "a.log.4", "a.log.5", "a.log.6",
                                  "a.log.7", "empty.log", "other.txt"}));
  EXPECT_EQ(get("logs/a.log.1"), "9");
  EXPECT_EQ(get("logs/a.log.7"), "3");
  std::filesystem::remove(at("logs/a.log.3"));  // a gap, as a kill in between leaves it
  put("logs/a.log", "10");
  ASSERT_TRUE(rollLogs(folder("logs")));
  EXPECT_EQ(get("logs/a.log.3"), "8");
  EXPECT_EQ(get("logs/a.log.7"), "3") << "nothing had to go";
}

TEST_F(StructuredDataTest, SubmissionIsAllowedUnlessSomeoneSaysNo) {
  const char* const kProgramFile = "var/mobile/Library/Preferences/vellum.tallyd.plist";
  const std::string waiting = "var/mobile/Library/Logs/Submission/0000000001-a.log";
  const auto enabled = [&] {
    const Platform device = makeLinuxPlatform(root, {log, false});
    device.crashReporting->FDDumpAllOldStructuredDataLogs();
    return device.crashReporting->isDiagnosticSubmissionEnabled();
  };
  const auto putSwitch = [&](const std::string& file, const std::string& value) {
    putPlist(file, "<dict><key>DiagnosticSubmissionEnabled</key>" + value + "</dict>");
  };
  put(waiting, "x");
  EXPECT_TRUE(enabled());
  // What may be a refusal lets nothing out, and deletes nothing.
  putSwitch(kProgramFile, "<string>no</string>");
  EXPECT_FALSE(enabled());
  std::filesystem::remove(at(kProgramFile));
  std::filesystem::create_symlink("vellum.tallyd.plist", at(kProgramFile));  // to itself
  EXPECT_FALSE(enabled());
  EXPECT_TRUE(exists(waiting));
  std::filesystem::remove(at(kProgramFile));
  putSwitch(kProgramFile, "<false/>");
  EXPECT_FALSE(enabled());
  EXPECT_FALSE(exists(waiting));
  putSwitch("device/device.plist", "<true/>");
  EXPECT_TRUE(enabled());
}

TEST_F(StructuredDataTest, WhatWaitsIsDeletedOrHeldWhenTheUserForbidsIt) {
  const auto preferences = std::make_shared<fakes::FakePreferences>();
  const std::string logs = "var/mobile/Library/Logs/";
  const std::vector<std::string> waiting = {
      "Submission/0000000001-a.log", "Submission/0000000001-a.info.plist",
      "StructuredData/0000000002-172.pending", "AnalyticsEvents/0000000003-events.jsonl"};
  const auto allow = [&](bool allowed) {
    preferences->put("DiagnosticSubmissionEnabled", KvBoolean::of(allowed), "vellum.tallyd");
    const auto description = std::make_shared<DeviceDescription>(folder("device"), log);
    SubmissionConsent consent(root, log, preferences, description);
    EXPECT_EQ(consent.permits("x"), allowed);
    consent.enforce();
  };
  const auto state = [&] {
    std::size_t present = 0, held = 0;
    for (const std::string& name : waiting) {
      present += exists(logs + name) ? 1 : 0;
      held += exists(logs + name + ".held") ? 1 : 0;
    }
    return std::pair(present, held);
  };
  for (const std::string& name : waiting) put(logs + name, "x");
  put(logs + "Submission/notes.txt", "not ours");
  allow(true);
  EXPECT_EQ(state(), std::pair(std::size_t{4}, std::size_t{0}));
  preferences->put("WithdrawnLogs", KvString::create("hold"), "vellum.tallyd.tallyrun");
  allow(false);
  EXPECT_EQ(state(), std::pair(std::size_t{0}, std::size_t{4}));
  allow(true);
  EXPECT_EQ(state(), std::pair(std::size_t{4}, std::size_t{0}));
  preferences->put("WithdrawnLogs", nullptr, "vellum.tallyd.tallyrun");
  allow(false);
  EXPECT_EQ(state(), std::pair(std::size_t{0}, std::size_t{0}));
  EXPECT_TRUE(exists(logs + "Submission/notes.txt"));
}

}  // namespace
}  // namespace tally
