// The daily log: what is in it, in which order things happen, and what failures cost.
#include "report/daily_report.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <limits>

#include "fakes/fake_platform.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::int32_t kDay = 19999;

// A whitelist of exact keys (each with options, as plist text) in one group.
std::string whitelist(
    std::initializer_list<std::pair<std::string_view, std::string_view>> scalars,
    std::initializer_list<std::pair<std::string_view, std::string_view>> distributions = {}) {
  std::string text = "<plist version=\"1.0\"><dict><key>G</key><dict>";
  const auto add = [&text](std::string_view section, const auto& keys) {
    text += "<key>" + std::string(section) + "</key><dict>";
    for (const auto& [key, options] : keys) {
      text += "<key>" + std::string(key) + "</key><dict>" + std::string(options) + "</dict>";
    }
    text += "</dict>";
  };
  add("ScalarKeys", scalars);
  add("DistributionKeys", distributions);
  return text + "</dict></dict></plist>";
}

class ReportTest : public testing::Test {
 protected:
  void setWhitelist(const std::string& text) {
    fake.files->contents[std::string(kWhitelistPath)] = text;
  }
  // Whitelists keys with no options and records one of them, so that there is a log.
  void admit(std::initializer_list<std::pair<std::string_view, std::string_view>> scalars) {
    setWhitelist(whitelist(scalars));
    fake.metricsStore->putScalar(kDay, scalars.begin()->first, 7);
  }
  void writeLog(const KvArray* appInfo = nullptr, std::int32_t day = kDay) {
    Platform platform = fake.services();
    writeDailyLog(platform, day, appInfo);
  }
  KvRef<KvDictionary> document() {
    if (fake.logSubmission->logs.empty()) return nullptr;
    const auto decoded = decodePlist(fake.logSubmission->logs.back().body);
    return KvRef<KvDictionary>::share(kvCast<KvDictionary>(decoded->get()));
  }
  std::string scalar(std::string_view key) {
    const auto log = document();
    return log ? kvText(log->getAs<KvDictionary>("TBScalars")->get(key)) : "no log";
  }

  fakes::FakePlatform fake = fakes::makeFakePlatform();
};

std::vector<std::string> keysOf(const KvDictionary& dictionary) {
  std::vector<std::string> keys;
  for (const auto& entry : dictionary) keys.emplace_back(entry.key->view());
  return keys;
}

TEST_F(ReportTest, TheDocument) {
  setWhitelist(whitelist({{"a", ""}, {"b", "<key>sig_fig</key><integer>1</integer>"}},
                         {{"d", "<key>intervals</key><array><integer>10</integer></array>"},
                          {"empty", "<key>intervals</key><array/>"}}));
  fake.metricsStore->putScalar(kDay - 1, "a", 1);
  fake.metricsStore->putScalar(kDay, "a", 2);
  fake.metricsStore->putScalar(kDay, "b", 95);
  fake.metricsStore->putScalar(kDay, "secret", 3);
  fake.metricsStore->putScalar(kDay + 1, "a", 4);
  fake.metricsStore->putDistribution(kDay, "d", {5, 10, 30});
  fake.metricsStore->putDistribution(kDay, "empty", {});
  fake.metricsStore->putDistribution(kDay, "secret", {1});
  writeLog();
  const auto log = document();
  ASSERT_TRUE(log);
  EXPECT_THAT(keysOf(*log),
              ElementsAre("TBCrashLogVersion", "TBStartDate", "TBLogCreationDate", "TBMetadata",
                          "TBScalars", "TBDistributions", "TBDistributionsHistogram", "TBTasking",
                          "TBTaskID", "TBTaskDigest", "TBWhitelistDigest"));
  const auto text = [&](std::string_view key) { return kvText(log->get(key)); };
  EXPECT_EQ(text("TBCrashLogVersion"), "1");
  EXPECT_EQ(text("TBStartDate"), "2024-10-03T00:00:00Z");
  EXPECT_EQ(text("TBLogCreationDate"), "2024-10-04T12:00:00Z");
  EXPECT_EQ(text("TBScalars"), "{\n    a = 2;\n    b = 100;\n}");
  EXPECT_EQ(text("TBDistributionsHistogram"),
            "{\n    d = {\n        (-inf, 10] = 2;\n        (10, inf) = 1;\n    };\n}");
  const auto* distributions = log->getAs<KvDictionary>("TBDistributions");
  EXPECT_THAT(keysOf(*distributions), ElementsAre("d", "empty"));
  const auto* statistics = distributions->getAs<KvArray>("d");
  ASSERT_EQ(statistics->size(), 5u);
  EXPECT_TRUE(statistics->getAs<KvNumber>(3)->isReal());
  EXPECT_EQ(statistics->getAs<KvNumber>(3)->asDouble(), 350.0);
  EXPECT_FALSE(statistics->getAs<KvNumber>(4)->isReal());
  EXPECT_EQ(text("TBTasking"), "(\n)");
  EXPECT_EQ(text("TBTaskID"), "(no tasking id)");
  EXPECT_EQ(text("TBTaskDigest"), "(no tasking digest)");
  EXPECT_EQ(log->getString("TBWhitelistDigest")->size(), 32u);
  EXPECT_EQ(text("TBMetadata"),
            "{\n    TBUserInterfaceLanguage = de;\n    TBPreferredUserInterfaceLanguage = de-CH;\n"
            "    TBUserSetRegionFormat = CH;\n}");
  EXPECT_TRUE(fake.log->has(LogLevel::Info, "writing tallyd log. yesterday=19999"));
  EXPECT_TRUE(fake.log->has(LogLevel::Debug, "Treating key d as a histogram"));
  EXPECT_THAT(fake.log->texts(LogLevel::Error), IsEmpty());
}

TEST_F(ReportTest, TheTaskingInForceAndTheAppListAreCarried) {
  admit({{"a", ""}});
  fake.preferences->put("TaskingID", KvNumber::int32(17), kProgramDomain);
  fake.preferences->put("TaskingDigest", KvString::create("abc"), kProgramDomain);
  fake.preferences->put("TaskingPayload", KvArray::create({KvString::create("x")}), kProgramDomain);
  fake.locale->preferred.clear();
  fake.locale->system.clear();
  fake.locale->region.reset();
  writeLog(KvArray::create().get());
  const auto log = document();
  EXPECT_EQ(kvText(log->get("TBTaskID")), "17");
  EXPECT_EQ(log->get("TBTaskID")->type(), KvType::String);
  EXPECT_EQ(kvText(log->get("TBTaskDigest")), "abc");
  EXPECT_EQ(kvText(log->get("TBTasking")), "(\n    x\n)");
  EXPECT_EQ(log->size(), 12u);
  EXPECT_EQ(kvText(log->get("TBActivatedAppInfo")), "(\n)");
  EXPECT_EQ(kvText(log->get("TBMetadata")),
            "{\n    TBUserInterfaceLanguage = <unknown>;\n"
            "    TBPreferredUserInterfaceLanguage = <unknown>;\n}");
}

TEST_F(ReportTest, NothingWhitelistedMeansNoLogAndNoTrace) {
  setWhitelist(whitelist({{"vellum.sysmetra.tlyd.database.corruptions", ""},
                          {"vellum.dockyard.numAllInstalledApps", ""}}));
  fake.metricsStore->putScalar(kDay, "secret", 1);
  writeLog();
  EXPECT_THAT(*fake.calls, IsEmpty());
  EXPECT_EQ(fake.appRegistry->enumerations, 0);
  writeLog(nullptr, std::numeric_limits<std::int32_t>::min());
  EXPECT_THAT(*fake.calls, IsEmpty());
  fake.files->contents.clear();
  writeLog();
  EXPECT_THAT(*fake.calls, IsEmpty());
}

TEST_F(ReportTest, TheSystemVersionIsNotedOnceBeforeTheSubmission) {
  admit({{"a", ""}});
  const auto options = [&] { return kvText(fake.logSubmission->logs.back().options.get()); };
  writeLog();
  EXPECT_EQ(options(), "{\n    previous_os_version = <unknown>;\n}");
  EXPECT_THAT(*fake.calls,
              ElementsAre("set vellum.tallyd.tallyrun LastOSVersion=1.0 (1A1)",
                          "synchronize vellum.tallyd.tallyrun", "submit 193 log-tallyd"));
  writeLog();
  EXPECT_EQ(fake.logSubmission->logs.back().options.get(), nullptr);
  fake.deviceInformation->osVersion = "1.1 (1B2)";
  writeLog();
  EXPECT_EQ(options(), "{\n    previous_os_version = 1.0 (1A1);\n}");
  EXPECT_EQ(fake.logSubmission->logs.back().writes, 1u);
  EXPECT_FALSE(fake.logSubmission->logs.back().reservedGiven);
}

TEST_F(ReportTest, TheConfigurationNumberIsForInternalDiagnosticsOnly) {
  admit({{"a", ""}});
  fake.preferences->put("LastOSVersion", KvString::create("1.0 (1A1)"), kProgramDomain);
  const auto data = [](std::string_view text) {
    return KvData::create(std::as_bytes(std::span(text.data(), text.size())));
  };
  using namespace std::string_view_literals;
  const struct {
    bool internal;
    KvRef<KvObject> answer;
    const char* expected;
  } cases[] = {
      {true, nullptr, "(null)"},
      {true, data("R1\0rest"sv), "{\n    ConfigNumber = R1;\n}"},
      {true, data("\xFF\0"sv), "(null)"},
  };
  for (const auto& c : cases) {
    fake.deviceInformation->internalSubsystems.clear();
    if (c.internal) {
      fake.deviceInformation->internalSubsystems.insert("vellum.sysmetra.tallyd.tallyrun");
    }
    fake.deviceInformation->answers["ConfigNumber"] = c.answer;
    writeLog();
    EXPECT_EQ(kvText(fake.logSubmission->logs.back().options.get()), c.expected);
  }
}

TEST_F(ReportTest, AFailedSubmissionIsSaidAndKeepsTheNotedVersion) {
  admit({{"a", ""}});
  fake.logSubmission->failWrite = true;
  writeLog();
  EXPECT_THAT(fake.log->texts(LogLevel::Error), ElementsAre("Failed to write tallyd log"));
  EXPECT_TRUE(fake.preferences->SMAPreferencesGetValue("LastOSVersion", kProgramDomain));
}

TEST_F(ReportTest, ADocumentThatCannotBeEncodedChangesNoPreference) {
  admit({{"a", ""}});
  const auto cycle = KvArray::create();
  cycle->append(cycle);
  fake.preferences->put("TaskingPayload", cycle, kProgramDomain);
  writeLog();
  EXPECT_THAT(fake.log->texts(LogLevel::Error),
              ElementsAre(testing::StartsWith("Could not create tallyd plist: ")));
  EXPECT_THAT(*fake.calls, IsEmpty());
  cycle->removeAt(0);
}

TEST_F(ReportTest, ApplicationsAreCountedOnlyForThoseWhoAsk) {
  fake.appRegistry->bundleTypes = {"User", "System", "User"};
  admit({{"a", ""}, {"vellum.dockyard.numThirdPartyApps", ""}});
  writeLog();
  EXPECT_EQ(scalar("vellum.dockyard.numThirdPartyApps"), "2");
  EXPECT_EQ(scalar("vellum.dockyard.numAllInstalledApps"), "(null)");
  admit({{"a", ""}});
  writeLog();
  EXPECT_EQ(fake.appRegistry->enumerations, 1);
}

TEST_F(ReportTest, TheStoresFileIsMeasuredInWholeMebibytes) {
  constexpr std::string_view kKey = "vellum.sysmetra.tlyd.database.size";
  admit({{"a", ""}, {kKey, ""}});
  auto& sizes = fake.files->sizes;
  constexpr const char* kPath = "/var/mobile/Library/Tallybook/TBDataStore.sqlitedb";
  writeLog();
  EXPECT_EQ(scalar(kKey), "-1");
  sizes[kPath] = 1048575;
  writeLog();
  EXPECT_EQ(scalar(kKey), "0");
  sizes[kPath] = 1048576 * 3 + 5;
  writeLog();
  EXPECT_EQ(scalar(kKey), "3");
}

TEST_F(ReportTest, TheCorruptionCountIsTakenAndReset) {
  constexpr std::string_view kKey = "vellum.sysmetra.tlyd.database.corruptions";
  constexpr const char* kNoLibrary = "Failed to dynamically load the FaultDeskSupport framework";
  constexpr const char* kNoRead = "Failed to dyanmically link SMAPreferencesGetIntegerValue";
  constexpr const char* kNoWrite = "Failed to dynamically link SMAPreferencesSetValue";
  const struct {
    bool present;
    std::set<std::string> missing;
    std::vector<std::string> errors;
    const char* recorded;
    const char* left;
  } cases[] = {
      {true, {}, {}, "5", "0"},
      {false, {}, {kNoLibrary}, "0", "5"},
      {true, {"SMAPreferencesGetIntegerValue"}, {kNoRead}, "0", "5"},
      {true, {"SMAPreferencesSetValue"}, {kNoWrite}, "0", "5"},
  };
  for (const auto& c : cases) {
    fake = fakes::makeFakePlatform();
    admit({{"a", ""}, {kKey, ""}});
    fake.preferences->put("DatabaseCorruptionCount", KvNumber::int32(5), "vellum.tallyd");
    fake.crashSupportLibrary->present = c.present;
    fake.crashSupportLibrary->missingSymbols = c.missing;
    writeLog();
    EXPECT_EQ(fake.log->texts(LogLevel::Error), c.errors);
    EXPECT_EQ(scalar(kKey), c.recorded);
    EXPECT_EQ(
        kvText(fake.preferences->SMAPreferencesGetValue("DatabaseCorruptionCount", "vellum.tallyd")
                   .get()),
        c.left);
    // A second report tries again only while something is missing.
    writeLog();
    EXPECT_EQ(fake.crashSupportLibrary->opened.size(), c.errors.empty() ? 1u : 2u);
    for (const std::string& call : *fake.calls) EXPECT_NE(call, "synchronize vellum.tallyd");
  }
}

TEST_F(ReportTest, UptimeIsWholeMinutes) {
  constexpr std::string_view kKey = "vellum.usage.cur_boot_session_cpu_uptime";
  admit({{"a", ""}, {kKey, ""}});
  const struct {
    std::uint64_t ticks;
    std::optional<Timebase> timebase;
    const char* expected;
    bool error;
  } cases[] = {
      {119'000'000'000, Timebase{1, 1}, "1", false},
      {24'000'000 * 600ULL, Timebase{125, 3}, "10", false},
      {5, std::nullopt, "-1", true},
      {UINT64_MAX, Timebase{UINT32_MAX, 1}, "1320469374930293248", false},
  };
  for (const auto& c : cases) {
    fake.log->lines.clear();
    fake.kernelValues->ticks = c.ticks;
    fake.kernelValues->timebase = c.timebase;
    writeLog();
    EXPECT_EQ(scalar(kKey), c.expected);
    EXPECT_EQ(fake.log->has(LogLevel::Error, "Couldn't retrieve mach_timebase_info"), c.error);
  }
}

TEST_F(ReportTest, KernelCountersAndPercentages) {
  constexpr std::string_view kOther = "vellum.memorystatus_freezer_error_other_count";
  constexpr std::string_view kFull = "vellum.memorystatus_freezer_skipped_full_count";
  admit({{"a", ""},
         {"vellum.kernel.memorystatus_freeze_count", ""},
         {"vellum.kernel.memorystatus_thaw_count", ""},
         {"vellum.kernel.memorystatus_freeze_pageouts", ""},
         {"vellum.kernel.swapusage", ""},
         {"vellum.memorystatus_freezer_thaw_percentage", ""},
         {kOther, ""},
         {kFull, ""}});
  {
    auto& kernel = *fake.kernelValues;
    kernel.put("kern.memorystatus_freeze_count", std::uint32_t{4000000000});
    kernel.fail("kern.memorystatus_thaw_count", 2);
    kernel.put("vm.swapusage", std::array<std::uint64_t, 4>{77, 1, 2, 3});
    kernel.put("kern.memorystatus_freezer_thaw_percentage", std::uint64_t{12});
    kernel.put("kern.memorystatus_freezer_process_considered_count", std::uint64_t{3});
    kernel.put("kern.memorystatus_freezer_error_other_count", std::uint64_t{2});
    kernel.put("kern.memorystatus_freezer_below_threshold_count", std::uint64_t{0});
    kernel.put("kern.memorystatus_freezer_skipped_full_count", std::uint64_t{2});
  }
  writeLog();
  EXPECT_EQ(scalar("vellum.kernel.memorystatus_freeze_count"), "4000000000");
  EXPECT_EQ(scalar("vellum.kernel.memorystatus_thaw_count"), "4294967295");
  EXPECT_EQ(scalar("vellum.kernel.memorystatus_freeze_pageouts"), "-1");
  EXPECT_EQ(scalar("vellum.kernel.swapusage"), "77");
  EXPECT_EQ(scalar("vellum.memorystatus_freezer_thaw_percentage"), "12");
  EXPECT_EQ(scalar(kOther), "66");
  EXPECT_EQ(scalar(kFull), "(null)") << "a share of nothing is not recorded";
  // What is not whitelisted is not read, but for the two denominators.
  const auto& reads = fake.kernelValues->reads;
  EXPECT_EQ(reads.size(), 9u) << testing::PrintToString(reads);

  fake.kernelValues->fail("kern.memorystatus_freezer_error_other_count", 5);
  writeLog();
  EXPECT_EQ(scalar(kOther), "(null)") << "its own counter could not be read";
  fake.kernelValues->put("kern.memorystatus_freezer_error_other_count", std::uint64_t{1} << 63);
  writeLog();
  EXPECT_EQ(scalar(kOther), "9223372036854775807");
  fake.kernelValues->fail("kern.memorystatus_freezer_process_considered_count", 2);
  writeLog();
  EXPECT_EQ(scalar(kOther), "(null)") << "the denominator could not be read";
}

}  // namespace
}  // namespace tally
