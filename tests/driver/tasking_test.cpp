// Tasking: what an update writes and in which order, and that the next run completes what failed.
// That it also completes what a dead run left is the matter of tests/faults.
#include "driver/tasking.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <set>

#include "fakes/fake_platform.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string kOwn(kProgramDomain);

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
                  "remove " + kOwn + " TaskingUnfinished", "synchronize " + kOwn,
                  "post vellum.da.tasking_changed"));
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
                  "remove " + kOwn + " TaskingUnfinished", "synchronize " + kOwn,
                  "post vellum.da.tasking_changed"));
  EXPECT_TRUE(fake.log->has(LogLevel::Default, "Tasking update (A -> E, 1A1 -> 1A1)"));
  EXPECT_EQ(own("TaskingOS"), "1A1");
  EXPECT_THAT(update(schedule("E", nullptr)), ElementsAre("post vellum.da.tasking_changed"));
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
    EXPECT_EQ(!calls.empty() && calls.back() == "post vellum.da.tasking_changed", c.notified);
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
  EXPECT_THAT(effects,
              ElementsAre("set d Wi-Fi / Cellular=v", "set d =v", "set d ..=v", "set d twice=last",
                          "remove d k", "synchronize d", "post vellum.da.tasking_changed"));
  EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), bad);
  EXPECT_TRUE(fake.log->has(LogLevel::Error,
                            "tasking: entry 4 of the scheduled payload is skipped: its \"Domain\" "
                            "cannot be a file's name: ../d"));
  EXPECT_EQ(own("TaskingID"), "A") << "what can never be written keeps no tasking out of force";
  EXPECT_TRUE(
      kvEqual(fake.preferences->SMAPreferencesGetValue("TaskingPayload", kProgramDomain).get(),
              good.get()));
}

// The device's storage, some of which may fail to be written.
struct Device {
  std::map<std::string, std::string> own, system, users;
  std::set<std::string> failing, refusing;  // "DOMAIN", "DOMAIN KEY", "USER DOMAIN KEY"
  std::vector<std::string> attempts;        // to write; "-" before a removal
  KvRef<KvObject> scheduled;
  std::map<std::string, KvRef<KvObject>> record;  // the program's own domain, with its types
};
class FailingStores final : public Preferences,
                            public SMASystemConfiguration,
                            public SMAServicesClient {
 public:
  explicit FailingStores(Device& device) : device_(device) {}

  KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view domain) override {
    if (domain != kProgramDomain) return nullptr;
    const auto found = device_.record.find(std::string(key));
    return found == device_.record.end() ? nullptr : found->second;
  }
  void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                              std::string_view domain) override {
    pending_[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
  }
  WriteResult SMAPreferencesSynchronize(std::string_view domain) override {
    if (const WriteResult result = resultOf(std::string(domain)); !result) return result;
    for (const auto& [key, value] : pending_[std::string(domain)]) {
      if (domain == kProgramDomain) {
        device_.record[key] = value;
        if (!value) device_.record.erase(key);
      } else {
        store(device_.own, std::string(domain) + " " + key, value.get());
      }
    }
    pending_.erase(std::string(domain));
    return WriteResult::Written;
  }
  KvRef<KvObject> getPreference(std::string_view key, std::string_view) override {
    return key == "ScheduledTasking" ? device_.scheduled : nullptr;
  }
  WriteResult setPreference(std::string_view key, KvRef<KvObject> value, std::string_view domain,
                            bool) override {
    return store(device_.system, std::string(domain) + " " + std::string(key), value.get());
  }
  WriteResult setPreference(std::string_view key, std::string_view user, std::string_view domain,
                            KvRef<KvObject> value) override {
    return store(device_.users, fakes::FakeServicesClient::nameOf(key, user, domain), value.get());
  }
  WriteResult deletePreference(std::string_view key, std::string_view user,
                               std::string_view domain) override {
    return setPreference(key, user, domain, nullptr);
  }

 private:
  WriteResult resultOf(const std::string& name) const {
    if (device_.refusing.contains(name)) return WriteResult::Refused;
    return device_.failing.contains(name) ? WriteResult::Failed : WriteResult::Written;
  }
  WriteResult store(std::map<std::string, std::string>& values, const std::string& name,
                    const KvObject* value) {
    device_.attempts.push_back((value != nullptr ? "" : "-") + name);
    const WriteResult result = resultOf(name);
    if (!result) return result;
    if (value == nullptr) {
      values.erase(name);
    } else {
      values[name] = kvText(value);
    }
    return result;
  }
  Device& device_;
  std::map<std::string, std::map<std::string, KvRef<KvObject>>> pending_;
};

class FailingStoresTest : public TaskingTest {
 protected:
  void run(Device& device, const KvRef<KvDictionary>& scheduled) {
    device.scheduled = scheduled;
    device.attempts.clear();
    fake.log->lines.clear();
    fake.calls->clear();
    const auto stores = std::make_shared<FailingStores>(device);
    Platform services = fake.services();
    services.preferences = stores;
    services.systemConfiguration = stores;
    services.servicesClient = stores;
    updateTaskingState(services);
  }
  static std::map<std::string, std::string> everything(const Device& device) {
    auto all = device.own;
    all.insert(device.system.begin(), device.system.end());
    all.insert(device.users.begin(), device.users.end());
    for (const auto& [key, value] : device.record) all["record " + key] = kvText(value.get());
    return all;
  }
};

TEST_F(FailingStoresTest, WhatFailedIsTriedAgainAndNothingElse) {
  const auto B = taskingB(), A = taskingA();
  const KvRef<KvDictionary> none;
  using Names = std::vector<std::string>;
  // Tasking A is in force, and B is scheduled.
  const struct {
    const char* name;
    std::set<std::string> failing, refusing;  // while B is applied for the first time
    std::size_t lines;                        // about them
    const char* inForce;                      // then
    KvRef<KvDictionary> next;                 // scheduled for the second run, which meets no fault
    Names attempts;                           // of it
    const char* inForceAtLast;
    const char* newBuild = nullptr;  // since the second run
  } cases[] = {
      {"a system write", {"sys T"}, {}, 1, "(null)", B, {"sys T"}, "B"},
      {"both directions of one domain",
       {"vellum.da"},
       {},
       2,
       "(null)",
       B,
       {"-vellum.da G", "vellum.da common"},
       "B"},
      {"a refused write", {}, {"sys T"}, 1, "B", B, {}, "B"},
      {"a refused removal", {}, {"guest dom K"}, 1, "B", B, {}, "B"},
      {"the note",
       {kOwn},
       {},
       1,
       "A",
       B,
       {"-sys S", "-guest dom K", "sys T", "guest dom L", "-vellum.da G", "vellum.da common",
        "zz H"},
       "B"},
      {"withdrawn while failing", {"sys T"}, {}, 1, "(null)", none, {"sys T"}, "B"},
      {"the former one again",
       {"sys T", "guest dom K"},
       {},
       2,
       "(null)",
       A,
       {"-sys T", "-guest dom L", "-guest dom K", "sys S", "guest dom K", "-zz H", "vellum.da G",
        "vellum.da common"},
       "A"},
      {"a system update while failing",
       {"sys T"},
       {},
       1,
       "(null)",
       B,
       {"-sys T", "-guest dom L", "sys T", "guest dom L", "zz H", "vellum.da common"},
       "B",
       "1A2"},
  };
  const auto systemVersion = fake.deviceInformation->systemVersion;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    Device device, expected;
    fake.deviceInformation->systemVersion = systemVersion;
    run(device, A);
    device.failing = c.failing;
    device.refusing = c.refusing;
    const auto inForce = [&] {
      const auto found = device.record.find("TaskingID");
      return kvText(found == device.record.end() ? nullptr : found->second.get());
    };
    run(device, B);
    EXPECT_EQ(inForce(), c.inForce);
    EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), c.lines);
    EXPECT_EQ(fake.calls->empty(), c.failing.contains(kOwn)) << "posted when something changed";
    const bool isFinished = inForce() == "B";
    // Once more with the same faults, which changes nothing.
    if (!isFinished && !c.failing.contains(kOwn)) {
      const auto before = everything(device);
      run(device, B);
      EXPECT_EQ(everything(device), before);
      EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), c.lines);
      EXPECT_THAT(*fake.calls, IsEmpty()) << "nothing changed";
    }
    device.failing.clear();
    device.refusing.clear();
    if (c.newBuild != nullptr) {
      fake.deviceInformation->systemVersion =
          KvDictionary::create({{"ProductBuildVersion", text(c.newBuild)}});
    }
    run(device, c.next);
    EXPECT_EQ(device.attempts, c.attempts);
    EXPECT_EQ(inForce(), c.inForceAtLast);
    EXPECT_THAT(fake.log->texts(LogLevel::Error), IsEmpty());
    EXPECT_EQ(*fake.calls, isFinished ? Names{} : Names{"post vellum.da.tasking_changed"});
    if (!c.refusing.empty()) continue;
    run(expected, c.next ? c.next : B);
    auto found = everything(device), wanted = everything(expected);
    for (auto* all : {&found, &wanted}) {
      all->erase("record LastOSUpdate");
      if (!device.record.contains("TaskingID")) all->erase("record TaskingOS");
    }
    EXPECT_EQ(found, wanted);
  }
}

}  // namespace
}  // namespace tally
