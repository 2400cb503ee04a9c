// Run modes, the day check and the order of a day's tasks.
#include "driver/daily_job.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "config/whitelist_file.h"
#include "fakes/fake_platform.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::int32_t kToday = 20000;
constexpr const char* kLastDay = "LastCrashLogSerializationDateInDaysSince1970";

struct FakeEndpoint final : IpcEndpoint {
  explicit FakeEndpoint(std::shared_ptr<fakes::CallLog> log) : calls(std::move(log)) {}
  std::shared_ptr<fakes::CallLog> calls;
  KvRef<KvDictionary> atTheStart, atTheEnd;  // messages that arrive; null: none
  MessageHandler take;

  bool listen(std::string_view name, MessageHandler handler) override {
    calls->push_back("listen " + std::string(name));
    take = std::move(handler);
    if (atTheStart) take(*atTheStart);
    return true;
  }
  bool stopListening() override {
    calls->push_back("stop listening");
    const auto message = std::exchange(atTheEnd, nullptr);
    if (message) take(*message);
    return static_cast<bool>(message);
  }
};

class DailyJobTest : public testing::Test {
 protected:
  DailyJobTest() {
    fake.files->contents[std::string(kWhitelistPath)] =
        "<plist version=\"1.0\"><dict><key>G</key><dict><key>ScalarKeys</key><dict><key>a</key>"
        "<dict/></dict></dict></dict></plist>";
    fake.preferences->put("LastOSVersion", KvString::create("1.0 (1A1)"), kProgramDomain);
    for (std::int32_t day = kToday - 3; day <= kToday; ++day) {
      fake.metricsStore->putScalar(day, "a", day);
    }
  }
  int run(std::vector<const char*> arguments) {
    arguments.insert(arguments.begin(), "tallyrun");
    Platform platform = fake.services();
    platform.ipcEndpoint = endpoint;
    return runDailyJob(
        platform, arguments,
        {.runTelemetrySweep =
             [](Platform& given) { given.notifications->postSystemNotification("sweep"); },
         .updateTaskingState =
             [](Platform& given) { given.notifications->postSystemNotification("tasking"); }});
  }
  // The days whose log was submitted, by the value that each day's row carries.
  std::vector<std::string> loggedDays() {
    std::vector<std::string> days;
    for (const auto& log : fake.logSubmission->logs) {
      const auto start = log.body.find("<integer>", log.body.find("<key>a</key>")) + 9;
      days.push_back(log.body.substr(start, log.body.find('<', start) - start));
    }
    return days;
  }
  std::string lastDay() {
    return kvText(fake.preferences->SMAPreferencesGetValue(kLastDay, kProgramDomain).get());
  }

  fakes::FakePlatform fake = fakes::makeFakePlatform();
  std::shared_ptr<FakeEndpoint> endpoint = std::make_shared<FakeEndpoint>(fake.calls);
};

TEST_F(DailyJobTest, SwitchesProcessTheirDay) {
  const struct {
    std::vector<const char*> arguments;
    std::optional<std::int32_t> stored;
    std::vector<std::string> days;
    std::string storedAfter;
    std::string message;  // between start and end, "" for any
  } cases[] = {
      {{"-d"}, kToday - 4, {"19999"}, "19999", ""},
      {{"-d"}, kToday - 1, {}, "19999", "Day unchanged since last run"},
      {{"-d"}, kToday + 9, {}, "20009", "Day unchanged since last run"},
      {{"-f"}, kToday - 1, {"19999"}, "19999", ""},
      {{"-t", "-f", "junk"}, std::nullopt, {"20000"}, "(null)", ""},
      {{"-D"}, std::nullopt, {}, "(null)", "Unknown arg: -D"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.arguments));
    fake.log->lines.clear();
    fake.logSubmission->logs.clear();
    fake.preferences->put(kLastDay, c.stored ? KvNumber::int32(*c.stored) : nullptr,
                          kProgramDomain);
    EXPECT_EQ(run(c.arguments), 0);
    EXPECT_EQ(loggedDays(), c.days);
    EXPECT_EQ(lastDay(), c.storedAfter);
    const auto messages = fake.log->texts(LogLevel::Default);
    EXPECT_EQ(messages.front(), "tallyrun started");
    EXPECT_EQ(messages.back(), "tallyrun ended");
    EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), c.stored > kToday - 1 ? 1u : 0u);
    if (!c.message.empty()) {
      EXPECT_THAT(messages, ElementsAre("tallyrun started", c.message, "tallyrun ended"));
    }
  }
}

TEST_F(DailyJobTest, TheSequenceOfADay) {
  using Calls = std::vector<std::string>;
  const std::string domain(kProgramDomain);
  const Calls whole = {"lock",
                       "TBClientCheckpoint",
                       "isDiagnosticSubmissionEnabled",
                       "submit 193 log-tallyd",
                       "post sweep",
                       "FDDumpAllOldStructuredDataLogs",
                       "post tasking",
                       "rollFixlineLogs",
                       "set " + domain + " " + kLastDay + "=19999",
                       "synchronize " + domain,
                       "unlock"};
  run({"-d"});
  EXPECT_EQ(*fake.calls, whole);
  EXPECT_TRUE(fake.log->has(LogLevel::Default, "daily tasks for day 19999"));

  // A processed day opens neither store nor whitelist.
  fake.calls->clear();
  fake.files->reads.clear();
  fake.metricsStore->historiesOpened = 0;
  run({"-d"});
  EXPECT_EQ(*fake.calls, (Calls{"lock", "unlock"}));
  EXPECT_EQ(fake.metricsStore->historiesOpened, 0);

  // Without the user's consent no whitelist is read, but the other tasks run.
  fake.calls->clear();
  fake.crashReporting->submissionEnabled = false;
  run({"-f"});
  Calls others = whole;
  others.erase(others.begin() + 8, others.begin() + 10);
  others.erase(others.begin() + 3);
  EXPECT_EQ(*fake.calls, others);
  EXPECT_THAT(fake.files->reads, IsEmpty());
}

TEST_F(DailyJobTest, TheScheduledModeWaitsOutAQuietSlice) {
  fake.eventLoop->results = {SliceResult::HandledEvent, SliceResult::Stopped,
                             SliceResult::HandledEvent, SliceResult::TimedOut};
  EXPECT_EQ(run({}), 0);
  EXPECT_THAT(fake.eventLoop->slices, ElementsAre(10.0, 10.0, 10.0, 10.0));
  EXPECT_THAT(*fake.calls, ElementsAre("listen vellum.tallyd.tallyrun", "stop listening"));
  EXPECT_THAT(fake.log->texts(LogLevel::Default),
              ElementsAre("tallyrun started", "tallyrun ended"));
}

TEST_F(DailyJobTest, AMessageAtTheEndGetsAQuietPeriodToo) {
  endpoint->atTheEnd = KvDictionary::create();
  run({});
  EXPECT_EQ(fake.eventLoop->slices.size(), 2u);
  EXPECT_THAT(*fake.calls,
              ElementsAre("listen vellum.tallyd.tallyrun", "stop listening", "stop listening"));
}

TEST_F(DailyJobTest, AnAppListThatNeverComesIsNotWaitedForLonger) {
  endpoint->atTheStart = KvDictionary::create({{"operation", KvNumber::int64(0)}});
  run({});
  EXPECT_TRUE(
      fake.log->has(LogLevel::Default, "never received requested AAI, so moving along without it"));
  EXPECT_EQ(loggedDays(), std::vector<std::string>{"19999"});
  EXPECT_EQ(lastDay(), "19999");
}

}  // namespace
}  // namespace tally
