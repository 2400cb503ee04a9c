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
      {"any of the same language", {"en", "pt-BR"}, {"pt-PT"}, {"pt-BR"}},
      {"script survives the region", {"zh", "zh-Hans"}, {"zh-Hans-CN"}, {"zh-Hans"}},
      {"one that serves twice", {"en", "de"}, {"de-CH", "de-AT", "en"}, {"de", "en"}},
      {"case and underscore", {"en", "de_CH"}, {"DE-ch"}, {"de_CH"}},
      {"no prefix of a language", {"en", "den"}, {"de"}, {"en"}},
      {"nothing serves", {"en", "fr"}, {"ja"}, {"en"}},
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
      {"false", KvBoolean::of(false), 0, false, true},
      {"number", KvNumber::int64(20049), 20049, true, true},
      {"zero", KvNumber::int32(0), 0, false, true},
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

}  // namespace
}  // namespace tally
