// The functions that all platforms share, on the fake platform.
#include <gtest/gtest.h>

#include "fakes/fake_platform.h"

namespace tally {
namespace {

using Tags = std::vector<std::string>;

TEST(BestLocalizations, ServesPreferencesInOrder) {
  const struct {
    const char* name;
    Tags available, preferred, expected;
  } cases[] = {
      {"exact tag before its language", {"de", "de-CH"}, {"de-CH"}, {"de-CH"}},
      {"without its region", {"en", "de-AT", "de"}, {"de-CH"}, {"de"}},
      {"any of the same language", {"en", "pt-BR"}, {"pt-PT"}, {"pt-BR"}},
      {"script survives the region", {"zh", "zh-Hans"}, {"zh-Hans-CN"}, {"zh-Hans"}},
      {"numeric region", {"es", "en"}, {"es-419"}, {"es"}},
      {"order of the preferences", {"en", "fr", "de"}, {"de-CH", "fr"}, {"de", "fr"}},
      {"one that serves twice", {"en", "de"}, {"de-CH", "de-AT", "en"}, {"de", "en"}},
      {"case and underscore", {"en", "de_CH"}, {"DE-ch"}, {"de_CH"}},
      {"no prefix of a language", {"en", "den"}, {"de"}, {"en"}},
      {"nothing serves", {"en", "fr"}, {"ja"}, {"en"}},
      {"no preference", {"fr", "en"}, {}, {"fr"}},
      {"nothing available", {}, {"de"}, {}},
      {"hostile tags", {"en"}, {"", "-", "--", "_x"}, {"en"}},
  };
  for (const auto& c : cases)
    EXPECT_EQ(BestLocalizations(c.available, c.preferred), c.expected) << c.name;
}

TEST(Preferences, TypedReads) {
  const auto fake = fakes::makeFakePlatform();
  const struct {
    const char* name;
    KvRef<KvObject> value;
    std::int32_t integer;
    bool boolean, exists;
  } cases[] = {
      {"absent", nullptr, 0, false, false},
      {"true", KvBoolean::of(true), 0, true, true},
      {"false", KvBoolean::of(false), 0, false, true},
      {"number", KvNumber::int64(20049), 20049, true, true},
      {"zero", KvNumber::int32(0), 0, false, true},
      {"fraction", KvNumber::float64(0.5), 0, true, true},
      {"text", KvString::create("7"), 0, false, false},
  };
  for (const auto& c : cases) {
    fake.preferences->put("key", c.value, "domain");
    bool exists = !c.exists;
    EXPECT_EQ(fake.preferences->SMAPreferencesGetIntegerValue("key", "domain"), c.integer)
        << c.name;
    EXPECT_EQ(fake.preferences->SMAPreferencesGetBoolValue("key", "domain", &exists), c.boolean)
        << c.name;
    EXPECT_EQ(exists, c.exists) << c.name;
    EXPECT_EQ(fake.preferences->SMAPreferencesGetBoolValue("key", "domain", nullptr), c.boolean);
  }
}

TEST(Platform, ScopesNestAndMessagesAreFormattedOnlyWhenSeen) {
  const auto outer = fakes::makeFakePlatform();
  const auto inner = fakes::makeFakePlatform();
  inner.log->lowest = LogLevel::Error;
  const auto scope = outer.install();
  {
    const auto nested = inner.install();
    logMessage(LogLevel::Info, "day {}", 1);
    logMessage(LogLevel::Error, "day {}", 2);
  }
  logMessage(LogLevel::Info, "day {}", 3);
  EXPECT_EQ(inner.log->lines,
            (std::vector<fakes::FakeSystemLog::Line>{{LogLevel::Error, "day 2"}}));
  EXPECT_EQ(outer.log->lines, (std::vector<fakes::FakeSystemLog::Line>{{LogLevel::Info, "day 3"}}));
}

TEST(Platform, AServiceCanLogWhileItEnds) {
  struct Farewell final : RunLock {
    bool enter() override { return true; }
    void leave() override {}
    ~Farewell() override { logMessage(LogLevel::Error, "not written"); }
  };
  const auto fake = fakes::makeFakePlatform();
  {
    Platform services = fake.services();
    services.runLock = std::make_shared<Farewell>();
    const PlatformScope scope(std::move(services));
  }
  EXPECT_TRUE(fake.log->has(LogLevel::Error, "not written"));
}

TEST(Platform, FaultsOfAKindAreOneLineAndTheirNumber) {
  auto fake = fakes::makeFakePlatform();
  fake.log = std::make_shared<fakes::FakeSystemLog>(fakes::FakeSystemLog::Repeats::Bounded);
  {
    const auto scope = fake.install();
    for (int i = 0; i < 1000; ++i) logFault("a", "a {}", i);
    logFault("b", "b");
    for (int i = 0; i < 3; ++i) fake.log->bounded(LogLevel::Info, 2, "c", "c {}", i);
    fake.log->writeOmitted();
    logFault("a", "again");
  }
  using Line = fakes::FakeSystemLog::Line;
  EXPECT_EQ(fake.log->lines, (std::vector<Line>{{LogLevel::Error, "a 0"},
                                                {LogLevel::Error, "b"},
                                                {LogLevel::Info, "c 0"},
                                                {LogLevel::Info, "c 1"},
                                                {LogLevel::Error, "a: 999 more"},
                                                {LogLevel::Info, "c: 1 more"},
                                                {LogLevel::Error, "a: 1 more"}}));
}

TEST(DayToDate, IsTheDaysFirstInstant) {
  EXPECT_EQ(DayToDate(20049)->secondsSince1970(), 20049 * 86400.0);
  EXPECT_EQ(DayToDate(INT32_MIN)->secondsSince1970(), -2147483648.0 * 86400.0);
}

}  // namespace
}  // namespace tally
