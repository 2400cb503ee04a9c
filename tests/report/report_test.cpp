// The daily log: what is in it, in which order things happen, and what happens on failures.
#include "platform/tables/known_preferences.h"
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
    const char* subsystem;
    KvRef<KvObject> answer;
    const char* expected;
  } cases[] = {
      {"vellum.sysmetra.tallyd.tallyrun", nullptr, "(null)"},
      {"vellum.sysmetra.tallyd.tallyrun", data("R1\0rest"sv), "{\n    ConfigNumber = R1;\n}"},
      {"vellum.sysmetra.tallyd.tallyrun", data("\xFF\0"sv), "(null)"},
      {"another", data("R1\0"sv), "(null)"},
  };
  for (const auto& c : cases) {
    fake.deviceInformation->internalSubsystems = {c.subsystem};
    fake.deviceInformation->answers["ConfigNumber"] = c.answer;
    writeLog();
    EXPECT_EQ(kvText(fake.logSubmission->logs.back().options.get()), c.expected);
  }
}

TEST_F(ReportTest, ADocumentThatCannotBeEncodedOrSubmittedIsAnError) {
  admit({{"a", ""}});
  const auto cycle = KvArray::create();
  cycle->append(cycle);
  fake.preferences->put("TaskingPayload", cycle, kProgramDomain);
  writeLog();
  EXPECT_THAT(fake.log->texts(LogLevel::Error),
              ElementsAre(testing::StartsWith("Could not create tallyd plist: ")));
  EXPECT_THAT(*fake.calls, IsEmpty()) << "no preference changes";
  cycle->removeAt(0);
  fake.log->lines.clear();
  fake.logSubmission->failWrite = true;
  writeLog();
  EXPECT_THAT(fake.log->texts(LogLevel::Error), ElementsAre("Failed to write tallyd log"));
  EXPECT_TRUE(fake.preferences->SMAPreferencesGetValue("LastOSVersion", kProgramDomain));
}

TEST_F(ReportTest, TheCorruptionCountIsTakenAndReset) {
  constexpr std::string_view kKey = "vellum.sysmetra.tlyd.database.corruptions";
  constexpr const KnownPreference& kCount = knownPreference("DatabaseCorruptionCount");
  const struct {
    bool isPresent;
    const char *missing, *error, *recorded, *left;
  } cases[] = {
      {true, "", "", "5", "0"},
      {false, "", "Failed to dynamically load the FaultDeskSupport framework", "0", "5"},
      {true, "SMAPreferencesGetIntegerValue",
       "Failed to dyanmically link SMAPreferencesGetIntegerValue", "0", "5"},
      {true, "SMAPreferencesSetValue", "Failed to dynamically link SMAPreferencesSetValue", "0",
       "5"},
  };
  for (const auto& c : cases) {
    fake = fakes::makeFakePlatform();
    admit({{"a", ""}, {kKey, ""}});
    fake.preferences->put(kCount.key, KvNumber::int32(5), kCount.domain);
    fake.crashSupportLibrary->present = c.isPresent;
    fake.crashSupportLibrary->missingSymbols = {c.missing};
    writeLog();
    const bool isSound = *c.error == '\0';
    EXPECT_EQ(testing::PrintToString(fake.log->texts(LogLevel::Error)),
              isSound ? "{}" : "{ \"" + std::string(c.error) + "\" }");
    EXPECT_EQ(scalar(kKey), c.recorded);
    EXPECT_EQ(kvText(fake.preferences->get(kCount).get()), c.left);
    // A second report tries again only while something is missing.
    writeLog();
    EXPECT_EQ(fake.crashSupportLibrary->opened.size(), isSound ? 1u : 2u);
    EXPECT_THAT(*fake.calls, testing::Not(testing::Contains("synchronize vellum.tallyd")));
  }
}

TEST_F(ReportTest, WhatTheReportMeasuresItself) {
  const std::string apps = "vellum.dockyard.numThirdPartyApps";
  const std::string size = "vellum.sysmetra.tlyd.database.size";
  const std::string uptime = "vellum.usage.cur_boot_session_cpu_uptime";
  const std::string other = "vellum.memorystatus_freezer_error_other_count";
  const std::string full = "vellum.memorystatus_freezer_skipped_full_count";
  const auto bytes = [](std::uint64_t count) {
    return [=](fakes::FakePlatform& given) { given.files->sizes[std::string(kStorePath)] = count; };
  };
  const auto ticks = [](std::uint64_t count, std::optional<Timebase> timebase) {
    return [=](fakes::FakePlatform& given) {
      given.kernelValues->ticks = count;
      given.kernelValues->timebase = timebase;
    };
  };
  const auto kernel = [](std::string name, auto value) {
    return [=](fakes::FakePlatform& given) { given.kernelValues->put("kern." + name, value); };
  };
  const auto share = [](std::optional<std::uint64_t> count, std::optional<std::uint64_t> total) {
    return [=](fakes::FakePlatform& given) {
      auto& values = *given.kernelValues;
      for (const char* name : {"error_other", "skipped_full"}) {
        if (count) values.put(fmt::format("kern.memorystatus_freezer_{}_count", name), *count);
      }
      for (const char* name : {"process_considered", "below_threshold"}) {
        if (total) values.put(fmt::format("kern.memorystatus_freezer_{}_count", name), *total);
      }
    };
  };
  const struct {
    std::string key;
    std::function<void(fakes::FakePlatform&)> device;
    const char* expected;
  } cases[] = {
      {apps,
       [](auto& given) {
         given.appRegistry->bundleTypes = {"User", "System", "User"};
       },
       "2"},
      {"vellum.dockyard.numAllInstalledApps",
       [](auto& given) {
         given.appRegistry->bundleTypes = {"User", "System", "User"};
       },
       "3"},
      {size, [](auto&) {}, "-1"},
      {size, bytes(1048575), "0"},
      {size, bytes(1048576 * 3 + 5), "3"},
      {uptime, ticks(119'000'000'000, Timebase{1, 1}), "1"},
      {uptime, ticks(24'000'000 * 600ULL, Timebase{125, 3}), "10"},
      {uptime, ticks(UINT64_MAX, Timebase{UINT32_MAX, 1}), "1320469374930293248"},
      {uptime, ticks(5, std::nullopt), "-1"},
      {"vellum.kernel.memorystatus_freeze_count",
       kernel("memorystatus_freeze_count", std::uint32_t{4000000000}), "4000000000"},
      {"vellum.kernel.memorystatus_thaw_count", [](auto&) {}, "4294967295"},
      {"vellum.kernel.memorystatus_freeze_pageouts", [](auto&) {}, "-1"},
      {"vellum.kernel.swapusage",
       [](auto& given) {
         given.kernelValues->put("vm.swapusage", std::array<std::uint64_t, 4>{77, 1, 2, 3});
       },
       "77"},
      {"vellum.memorystatus_freezer_thaw_percentage",
       kernel("memorystatus_freezer_thaw_percentage", std::uint64_t{12}), "12"},
      {other, share(2, 3), "66"},
      {full, share(2, 8), "25"},
      {full, share(2, 0), "(null)"},
      {other, share({}, 3), "(null)"},
      {other, share(3, {}), "(null)"},
      {other, share(std::uint64_t{1} << 63, 3), "9223372036854775807"},
  };
  for (const auto& c : cases) {
    fake = fakes::makeFakePlatform();
    admit({{"a", ""}, {c.key, ""}});
    c.device(fake);
    writeLog();
    EXPECT_EQ(scalar(c.key), c.expected) << c.key;
    const bool isWithoutTimebase = c.key == uptime && !fake.kernelValues->timebase;
    EXPECT_EQ(fake.log->has(LogLevel::Error, "Couldn't retrieve mach_timebase_info"),
              isWithoutTimebase);
    // What is not whitelisted is not read, but for the two denominators.
    EXPECT_LE(fake.kernelValues->reads.size(), 3u);
    EXPECT_EQ(fake.appRegistry->enumerations, c.key.starts_with("vellum.dockyard") ? 1 : 0);
  }
}

}  // namespace
}  // namespace tally
