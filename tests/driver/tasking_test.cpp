// Tasking: what an update writes and in which order, and that the next run completes what failed.
// tests/faults shows that it also completes what a killed run left.
#include "driver/tasking.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <map>
#include <set>

#include "fakes/fake_platform.h"
#include "platform/known_preferences.h"

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

// The stores of a device, as they are after a run: writes that are not flushed are lost.
struct DeviceStores final : Preferences, SMASystemConfiguration, SMAServicesClient {
  using Values = std::map<std::string, std::string>;
  Values values;                                  // by "DOMAIN KEY", "USER DOMAIN KEY"
  std::map<std::string, KvRef<KvObject>> record;  // the program's own domain, with its types
  std::set<std::string> failing, refusing;        // "DOMAIN", "DOMAIN KEY", "USER DOMAIN KEY"
  std::vector<std::string> attempts;              // to write; "-" before a removal
  KvRef<KvObject> scheduled;
  std::map<std::string, std::map<std::string, KvRef<KvObject>>> pending;

  KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view) override {
    const auto found = record.find(std::string(key));
    return found == record.end() ? nullptr : found->second;
  }
  void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                              std::string_view domain) override {
    pending[std::string(domain)].insert_or_assign(std::string(key), std::move(value));
  }
  WriteResult SMAPreferencesSynchronize(std::string_view name) override {
    const std::string domain(name);
    if (const WriteResult result = resultOf(domain); !result) return result;
    for (const auto& [key, value] : pending[domain]) {
      if (domain != kOwn) {
        store(domain + " " + key, value.get());
      } else if (value) {
        record[key] = value;
      } else {
        record.erase(key);
      }
    }
    pending.erase(domain);
    return WriteResult::Written;
  }
  KvRef<KvObject> getPreference(std::string_view, std::string_view) override { return scheduled; }
  WriteResult setPreference(std::string_view key, KvRef<KvObject> value, std::string_view domain,
                            bool) override {
    return store(std::string(domain).append(" ").append(key), value.get());
  }
  WriteResult setPreference(std::string_view key, std::string_view user, std::string_view domain,
                            KvRef<KvObject> value) override {
    return store(fakes::FakeServicesClient::nameOf(key, user, domain), value.get());
  }
  WriteResult deletePreference(std::string_view key, std::string_view user,
                               std::string_view domain) override {
    return setPreference(key, user, domain, nullptr);
  }

  WriteResult resultOf(const std::string& name) const {
    if (refusing.contains(name)) return WriteResult::Refused;
    return failing.contains(name) ? WriteResult::Failed : WriteResult::Written;
  }
  WriteResult store(const std::string& name, const KvObject* value) {
    attempts.push_back((value != nullptr ? "" : "-") + name);
    const WriteResult result = resultOf(name);
    if (result && value != nullptr) values[name] = kvText(value);
    if (result && value == nullptr) values.erase(name);
    return result;
  }
  Values everything() const {
    Values all = values;
    for (const auto& [key, value] : record) all["record " + key] = kvText(value.get());
    return all;
  }
  std::string inForce() const {
    const auto found = record.find("TaskingID");
    return found == record.end() ? "" : kvText(found->second.get());
  }
};

class FailingStoresTest : public TaskingTest {
 protected:
  void run(const std::shared_ptr<DeviceStores>& stores, const KvRef<KvDictionary>& scheduled) {
    stores->scheduled = scheduled;
    stores->attempts.clear();
    stores->pending.clear();
    fake.log->lines.clear();
    fake.calls->clear();
    Platform services = fake.services();
    services.preferences = stores;
    services.systemConfiguration = stores;
    services.servicesClient = stores;
    updateTaskingState(services);
  }
  // A list in which commas separate.
  static std::vector<std::string> split(std::string_view text) {
    std::vector<std::string> parts;
    while (!text.empty()) {
      const auto end = std::min(text.find(','), text.size());
      parts.emplace_back(text.substr(0, end));
      text.remove_prefix(std::min(end + 1, text.size()));
    }
    return parts;
  }
};

TEST_F(FailingStoresTest, WhatFailedIsTriedAgainAndNothingElse) {
  const auto A = taskingA(), B = taskingB();
  const KvRef<KvDictionary> none;
  // Tasking A is in force, and B is scheduled.
  const struct {
    const char *name, *failing, *refusing;  // while B is applied for the first time
    std::size_t lines;                      // about them
    const char* inForce;                    // then
    KvRef<KvDictionary> next;               // scheduled for the second run, which meets no fault
    const char *attempts, *inForceAtLast;   // of it, after it
    const char* newBuild = nullptr;         // since the second run
  } cases[] = {
      {"a system write", "sys T", "", 1, "", B, "sys T", "B"},
      {"a domain", "vellum.da", "", 2, "", B, "-vellum.da G,vellum.da common", "B"},
      {"a refused write", "", "sys T", 1, "B", B, "", "B"},
      {"a refused removal", "", "guest dom K", 1, "B", B, "", "B"},
      {"the note", kOwn.c_str(), "", 1, "A", B,
       "-sys S,-guest dom K,sys T,guest dom L,-vellum.da G,vellum.da common,zz H", "B"},
      {"withdrawn while failing", "sys T", "", 1, "", none, "sys T", "B"},
      {"the former one again", "sys T,guest dom K", "", 2, "", A,
       "-sys T,-guest dom L,-guest dom K,sys S,guest dom K,-zz H,vellum.da G,vellum.da common",
       "A"},
      {"a system update while failing", "sys T", "", 1, "", B,
       "-sys T,-guest dom L,sys T,guest dom L,zz H,vellum.da common", "B", "1A2"},
  };
  const auto systemVersion = fake.deviceInformation->systemVersion;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const auto device = std::make_shared<DeviceStores>(),
               expected = std::make_shared<DeviceStores>();
    fake.deviceInformation->systemVersion = systemVersion;
    run(device, A);
    const auto failing = split(c.failing), refusing = split(c.refusing);
    device->failing = {failing.begin(), failing.end()};
    device->refusing = {refusing.begin(), refusing.end()};
    const bool isUnrecorded = device->failing.contains(kOwn);
    run(device, B);
    EXPECT_EQ(device->inForce(), c.inForce);
    EXPECT_EQ(fake.log->texts(LogLevel::Error).size(), c.lines);
    EXPECT_EQ(fake.calls->empty(), isUnrecorded) << "posted when something changed";
    const bool isFinished = device->inForce() == "B";
    if (!isFinished && !isUnrecorded) {
      const auto before = device->everything();
      run(device, B);
      EXPECT_EQ(device->everything(), before) << "the same faults again";
      EXPECT_THAT(*fake.calls, IsEmpty()) << "nothing changed";
    }
    device->failing.clear();
    device->refusing.clear();
    if (c.newBuild != nullptr) {
      fake.deviceInformation->systemVersion =
          KvDictionary::create({{"ProductBuildVersion", text(c.newBuild)}});
    }
    run(device, c.next);
    EXPECT_EQ(device->attempts, split(c.attempts));
    EXPECT_EQ(device->inForce(), c.inForceAtLast);
    EXPECT_THAT(fake.log->texts(LogLevel::Error), IsEmpty());
    EXPECT_EQ(fake.calls->size(), isFinished ? 0u : 1u) << "posted when something changed";
    if (!refusing.empty()) continue;
    run(expected, c.next ? c.next : B);
    for (const auto& stores : {device, expected}) {
      stores->record.erase("LastOSUpdate");
      if (device->inForce().empty()) stores->record.erase("TaskingOS");
    }
    EXPECT_EQ(device->everything(), expected->everything());
  }
}

}  // namespace
}  // namespace tally
