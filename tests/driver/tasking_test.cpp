// Tasking: what an update writes and in which order, and that the next run completes what failed.
// tests/faults shows that it also completes what a killed run left.
#include "driver/tasking.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>

#include "fakes/fake_platform.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string kOwn(kProgramDomain);
const std::string kPosted = "post vellum.da.tasking_changed";

KvRef<KvObject> text(std::string_view value) { return KvString::create(value); }
KvRef<KvDictionary> entry(const char* user, const char* domain, const char* key,
                          const char* value) {
  return KvDictionary::create(
      {{"User", text(user)}, {"Domain", text(domain)}, {"Key", text(key)}, {"Value", text(value)}});
}
KvRef<KvDictionary> schedule(const char* id, KvRef<KvObject> payload) {
  auto made = KvDictionary::create(
      {{"TaskingID", text(id)}, {"TaskingDigest", text(std::string("digest of ") + id)}});
  made->set("TaskingPayload", std::move(payload));
  return made;
}
KvRef<KvDictionary> taskingA() {
  return schedule(
      "A", KvArray::create({entry("mobile", "vellum.da", "G", "a"),
                            entry("__sysmetra__", "sys", "S", "a"), entry("guest", "dom", "K", "a"),
                            entry("mobile", "vellum.da", "common", "a")}));
}
KvRef<KvDictionary> taskingB() {
  return schedule(
      "B", KvArray::create({entry("__sysmetra__", "sys", "T", "b"), entry("mobile", "zz", "H", "b"),
                            entry("guest", "dom", "L", "b"),
                            entry("mobile", "vellum.da", "common", "b")}));
}

class TaskingTest : public testing::Test {
 public:
  // Empty when no schedule is given.
  std::vector<std::string> update(KvRef<KvObject> scheduled) {
    put(std::move(scheduled));
    fake.calls->clear();
    fake.log->lines.clear();
    Platform platform = fake.services();
    updateTaskingState(platform);
    return *fake.calls;
  }
  void put(KvRef<KvObject> scheduled) {
    fake.systemConfiguration->values[{std::string(kScheduleDomain), "ScheduledTasking"}] =
        std::move(scheduled);
  }
  std::string own(std::string_view key) {
    return kvText(fake.preferences->SMAPreferencesGetValue(key, kProgramDomain).get());
  }

  fakes::FakePlatform fake = fakes::makeFakePlatform();
};

TEST_F(TaskingTest, AppliesAndRollsBackInOrder) {
  const auto payloadText = [](const KvDictionary& tasking) {
    return kvText(tasking.get("TaskingPayload"));
  };
  const std::string notes = "set " + kOwn + " TaskingUnfinished=";
  fake.preferences->put("LastOSUpdate", KvDictionary::create({{"version", text("1A1")}}),
                        kProgramDomain);
  EXPECT_THAT(
      update(taskingA()),
      ElementsAre(HasSubstr(notes), "synchronize " + kOwn, "set vellum.da G=a", "system sys S=a",
                  "user guest dom K=a", "set vellum.da common=a", "synchronize vellum.da",
                  "set " + kOwn + " TaskingID=A", "set " + kOwn + " TaskingOS=1A1",
                  "set " + kOwn + " TaskingDigest=digest of A",
                  "set " + kOwn + " TaskingPayload=" + payloadText(*taskingA()),
                  "remove " + kOwn + " TaskingUnfinished", "synchronize " + kOwn, kPosted));
  EXPECT_THAT(fake.log->lines, IsEmpty());

  EXPECT_THAT(update(taskingA()), IsEmpty());
  EXPECT_THAT(update(nullptr), IsEmpty()) << "a withdrawn schedule leaves the tasking in force";

  // Without a payload the former tasking goes, and nothing takes its place.
  EXPECT_THAT(
      update(schedule("E", nullptr)),
      ElementsAre(HasSubstr(notes), "remove " + kOwn + " TaskingID",
                  "remove " + kOwn + " TaskingDigest", "remove " + kOwn + " TaskingPayload",
                  "synchronize " + kOwn, "remove vellum.da G", "system sys S removed unsynced",
                  "user guest dom K deleted", "remove vellum.da common", "synchronize vellum.da",
                  "remove " + kOwn + " TaskingUnfinished", "synchronize " + kOwn, kPosted));
  EXPECT_TRUE(fake.log->has(LogLevel::Default, "Tasking update (A -> E, 1A1 -> 1A1)"));
  EXPECT_EQ(own("TaskingOS"), "1A1");
  EXPECT_THAT(update(schedule("E", nullptr)), ElementsAre(kPosted));
  EXPECT_THAT(fake.log->lines, IsEmpty());
}

TEST_F(TaskingTest, StatesOfTheRecordAndTheSchedule) {
  const auto none = [](TaskingTest&) {};
  const auto inForce = [](TaskingTest& t) { t.update(taskingA()); };
  const auto otherSystem = [](TaskingTest& t) {
    t.update(taskingA());
    t.fake.preferences->put("TaskingOS", text("0Z9"), kProgramDomain);
  };
  const auto controlled = [](TaskingTest& t) {
    t.fake.preferences->put("TaskingID", text("\uFFFD"), kProgramDomain);
    t.fake.preferences->put("TaskingOS", text("1A1"), kProgramDomain);
  };
  const auto withoutPayload = [](TaskingTest& t) {
    t.update(taskingA());
    t.fake.preferences->put("TaskingPayload", nullptr, kProgramDomain);
  };
  const struct {
    const char* name;
    std::function<void(TaskingTest&)> recorded;
    KvRef<KvObject> scheduled;
    const char *id, *g, *h;  // afterwards
    bool notified;
    const char* message;  // "" for none
  } cases[] = {
      {"none, none", none, nullptr, "(null)", "(null)", "(null)", false, ""},
      {"none, present", none, taskingB(), "B", "(null)", "b", true, ""},
      {"an ID that is stored in another form", controlled, schedule("\x01", KvArray::create()),
       "\uFFFD", "(null)", "(null)", false, ""},
      {"another system", otherSystem, taskingA(), "A", "a", "(null)", true,
       "Tasking update (A -> A, 0Z9 -> 1A1)"},
      {"another ID", inForce, taskingB(), "B", "(null)", "b", true,
       "Tasking update (A -> B, 1A1 -> 1A1)"},
      {"a record without payload", withoutPayload, schedule("E", nullptr), "A", "a", "(null)", true,
       "Tasking update (A -> E, 1A1 -> 1A1)"},
      {"not a dictionary", inForce, text("x"), "A", "a", "(null)", false,
       "tasking: the schedule is not a dictionary"},
      {"an ID that is no text", inForce, KvDictionary::create({{"TaskingID", KvNumber::int32(7)}}),
       "A", "a", "(null)", false, "tasking: the schedule's \"TaskingID\" is not a text"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    fake.preferences->values.clear();
    fake.preferences->put("LastOSUpdate", KvDictionary::create({{"version", text("1A1")}}),
                          kProgramDomain);
    c.recorded(*this);
    const auto calls = update(c.scheduled);
    EXPECT_EQ(own("TaskingID"), c.id);
    EXPECT_EQ(kvText(fake.preferences->SMAPreferencesGetValue("G", "vellum.da").get()), c.g);
    EXPECT_EQ(kvText(fake.preferences->SMAPreferencesGetValue("H", "zz").get()), c.h);
    EXPECT_EQ(!calls.empty() && calls.back() == kPosted, c.notified);
    EXPECT_EQ(fake.log->lines.empty() ? "" : fake.log->lines[0].text, std::string(c.message));
  }
}

TEST_F(TaskingTest, ASystemUpdateIsNotedOnce) {
  EXPECT_THAT(update(nullptr), ElementsAre(HasSubstr("set " + kOwn + " LastOSUpdate=")));
  EXPECT_TRUE(fake.log->has(LogLevel::Default, "OS change since last run ((null) -> 1A1)"));
  fake.clock->setDay(20005);
  EXPECT_THAT(update(nullptr), IsEmpty());
  const auto last = fake.preferences->SMAPreferencesGetValue("LastOSUpdate", kProgramDomain);
  EXPECT_EQ(kvCast<KvDictionary>(last.get())->getInt64("day"), 20000);
  fake.deviceInformation->systemVersion = KvDictionary::create();
  EXPECT_THAT(update(nullptr), IsEmpty()) << "an unknown build is no change";
}

TEST_F(TaskingTest, EntriesThatCanNeverBeWrittenAreSkippedWithALine) {
  const auto without = [](const char* field) {
    auto one = entry("mobile", "d", "k", "v");
    one->remove(field);
    return one;
  };
  auto deep = KvArray::create();
  for (int i = 0; i < 512; ++i) deep = KvArray::create({deep});
  auto tooDeep = entry("mobile", "d", "k", "v");
  tooDeep->set("Value", deep);
  const auto good =
      KvArray::create({entry("mobile", "d", "Wi-Fi / Cellular", "v"), entry("mobile", "d", "", "v"),
                       entry("mobile", "d", "..", "v"), entry("mobile", "d", "twice", "first"),
                       entry("mobile", "d", "twice", "last"), without("Value")});
  const auto payload = KvArray::create(
      {text("x"), without("Domain"), without("User"), without("Key"),
       entry("mobile", "../d", "k", "v"), entry("mobile", "..", "k", "v"),
       entry("a/b", "d", "k", "v"), entry("..", "d", "k", "v"), entry("", "d", "k", "v"),
       entry("mobile", "d\x01", "k", "v"), entry("__sysmetra__", "/etc/d", "k", "v"),
       KvDictionary::create({{"User", KvNumber::int32(0)}, {"Domain", text("d")}}),
       entry("mobile", "d", "k\x01", "v"), entry("mobile", "d", "k", "v\x01"), tooDeep});
  const std::size_t bad = payload->size();
  for (const auto& one : *good) payload->append(one);
  std::vector<std::string> effects;
  for (const std::string& call : update(schedule("A", payload))) {
    if (call.find(kOwn) == call.npos) effects.push_back(call);
  }
  EXPECT_THAT(effects, ElementsAre("set d Wi-Fi / Cellular=v", "set d =v", "set d ..=v",
                                   "set d twice=last", "remove d k", "synchronize d", kPosted));
  EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), bad);
  EXPECT_TRUE(fake.log->has(LogLevel::Error,
                            "tasking: entry 4 of the scheduled payload is skipped: its \"Domain\" "
                            "cannot be a file's name: ../d"));
  EXPECT_EQ(own("TaskingID"), "A") << "what can never be written keeps no tasking out of force";
  EXPECT_TRUE(
      kvEqual(fake.preferences->SMAPreferencesGetValue("TaskingPayload", kProgramDomain).get(),
              good.get()));
}

TEST_F(TaskingTest, WhatFailedIsTriedAgainAndNothingElse) {
  using Values = std::map<std::string, WriteResult>;
  using Calls = std::vector<std::string>;
  const auto A = taskingA(), B = taskingB();
  const KvRef<KvDictionary> none;
  const Values sysT = {{"sys T", WriteResult::Failed}};
  // Tasking A is in force, and B is scheduled.
  const struct {
    const char* name;
    Values failures;            // of the system and of users, while B is applied first
    std::string failingDomain;  // of the program, likewise
    std::size_t lines;          // about them
    const char* inForce;        // then
    KvRef<KvDictionary> next;   // scheduled for the second run, which meets no fault
    Calls attempts;             // of it
    const char* inForceAtLast;
    const char* newBuild = nullptr;  // since the second run
  } cases[] = {
      {"a system write", sysT, "", 1, "(null)", B, {"system sys T=b"}, "B"},
      {"a domain",
       {},
       "vellum.da",
       2,
       "(null)",
       B,
       {"remove vellum.da G", "set vellum.da common=b", "synchronize vellum.da"},
       "B"},
      {"a refused write", {{"sys T", WriteResult::Refused}}, "", 1, "B", B, {}, "B"},
      {"a refused removal", {{"guest dom K", WriteResult::Refused}}, "", 1, "B", B, {}, "B"},
      {"the note",
       {},
       kOwn,
       1,
       "A",
       B,
       {"remove vellum.da G", "system sys S removed unsynced", "user guest dom K deleted",
        "remove vellum.da common", "system sys T=b", "set zz H=b", "user guest dom L=b",
        "set vellum.da common=b", "synchronize vellum.da", "synchronize zz"},
       "B"},
      {"withdrawn while failing", sysT, "", 1, "(null)", none, {"system sys T=b"}, "B"},
      {"the former one again",
       {{"sys T", WriteResult::Failed}, {"guest dom K", WriteResult::Failed}},
       "",
       2,
       "(null)",
       A,
       {"system sys T removed unsynced", "remove zz H", "user guest dom L deleted",
        "remove vellum.da common", "user guest dom K deleted", "set vellum.da G=a",
        "system sys S=a", "user guest dom K=a", "set vellum.da common=a", "synchronize zz",
        "synchronize vellum.da"},
       "A"},
      {"a system update while failing",
       sysT,
       "",
       1,
       "(null)",
       B,
       {"system sys T removed unsynced", "remove zz H", "user guest dom L deleted",
        "remove vellum.da common", "system sys T=b", "set zz H=b", "user guest dom L=b",
        "set vellum.da common=b", "synchronize zz", "synchronize vellum.da"},
       "B",
       "1A2"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    fake = fakes::makeFakePlatform();
    update(A);
    const auto stored = fake.preferences->values;
    fake.systemConfiguration->failures = fake.servicesClient->failures = c.failures;
    fake.preferences->failingDomains = {c.failingDomain};
    const bool isNoted = c.failingDomain != kOwn;
    EXPECT_EQ(update(B).back() == kPosted, isNoted) << "posted when something changed";
    if (!isNoted) fake.preferences->values = stored;  // what was not flushed is lost
    EXPECT_EQ(own("TaskingID"), c.inForce);
    EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), c.lines);
    const bool isFinished = own("TaskingID") == "B";
    if (!isFinished && isNoted) {
      EXPECT_NE(update(B).back(), kPosted) << "the same faults change nothing";
    }
    fake.systemConfiguration->failures = fake.servicesClient->failures = {};
    fake.preferences->failingDomains.clear();
    if (c.newBuild != nullptr) {
      fake.deviceInformation->systemVersion =
          KvDictionary::create({{"ProductBuildVersion", text(c.newBuild)}});
    }
    Calls attempts = update(c.next);
    EXPECT_EQ(!attempts.empty() && attempts.back() == kPosted, !isFinished);
    std::erase_if(attempts, [](const std::string& call) {
      return call == kPosted || call.find(kOwn) != call.npos;
    });
    EXPECT_EQ(attempts, c.attempts);
    EXPECT_EQ(own("TaskingID"), c.inForceAtLast);
    EXPECT_THAT(fake.log->texts(LogLevel::Error), IsEmpty());
  }
}

}  // namespace
}  // namespace tally
