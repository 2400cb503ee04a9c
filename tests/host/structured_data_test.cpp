// Structured-data logs and the rolling of logs across kills and damage.
#include "host/spool/structured_data.h"

#include "host/linux_platform.h"
#include "host/spool/crash_reporting.h"
#include "host/temporary_root.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

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

  StructuredDataFolder data{folder("data"), *clock, *log};
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
  EXPECT_THAT(finish(), testing::ElementsAre(testing::HasSubstr("1 damaged")));
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

// What waits is deleted or held back when the user forbids submission, and released again; nothing
// is touched while it is not known what the user wants.
TEST_F(StructuredDataTest, TheUsersWishDecidesAboutWhatWaits) {
  const std::string home = "var/mobile/Library/", file = home + "Preferences/vellum.tallyd.plist";
  const std::string waiting[] = {
      "Submission/0000000001-a.log", "Submission/0000000001-a.info.plist",
      "StructuredData/0000000002-172.plist", "AnalyticsEvents/0000000003-events.jsonl"};
  const std::string pending = home + "Logs/StructuredData/0000000004-172.pending";
  const auto putSwitch = [&](const std::string& path, const std::string& value) {
    std::filesystem::remove(at(path));
    putPlist(path, "<dict><key>DiagnosticSubmissionEnabled</key>" + value + "</dict>");
  };
  const auto hold = [&](const char* value) {
    putPlist(home + "Preferences/vellum.tallyd.tallyrun.plist",
             "<dict><key>WithdrawnLogs</key><string>" + std::string(value) + "</string></dict>");
  };
  const struct {
    const char* name;
    std::function<void()> change;
    bool allowed;
    std::size_t present, held;
  } cases[] = {
      {"nothing said", [] {}, true, 4, 0},
      {"no switch at all", [&] { putSwitch(file, "<string>no</string>"); }, false, 4, 0},
      {"a switch that cannot be read",
       [&] {
         std::filesystem::remove(at(file));
         std::filesystem::create_symlink("vellum.tallyd.plist", at(file));  // to itself
       },
       false, 4, 0},
      {"allowed", [&] { putSwitch(file, "<true/>"); }, true, 4, 0},
      {"forbidden, to be held", [&] { hold("hold"), putSwitch(file, "<false/>"); }, false, 0, 4},
      {"allowed again", [&] { putSwitch(file, "<true/>"); }, true, 4, 0},
      {"forbidden", [&] { hold(""), put(pending, "x"), putSwitch(file, "<false/>"); }, false, 0, 0},
      {"the description allows", [&] { putSwitch("device/device.plist", "<true/>"); }, true, 0, 0},
  };
  for (const std::string& name : waiting) put(home + "Logs/" + name, "x");
  put(home + "Logs/Submission/notes.txt", "not ours");
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    c.change();
    const Platform device = makeLinuxPlatform(root, {log, false});
    device.crashReporting->FDDumpAllOldStructuredDataLogs();
    EXPECT_EQ(device.crashReporting->isDiagnosticSubmissionEnabled(), c.allowed);
    std::size_t present = 0, held = 0;
    for (const std::string& name : waiting) {
      present += exists(home + "Logs/" + name);
      held += exists(home + "Logs/" + name + ".held");
    }
    EXPECT_EQ(std::pair(present, held), std::pair(c.present, c.held));
  }
  EXPECT_FALSE(exists(pending));
  EXPECT_TRUE(exists(home + "Logs/Submission/notes.txt"));
}

}  // namespace
}  // namespace tally
