// Preference files: what other processes, kills and damage do to them.
#include "host/preferences/property_list_preferences.h"

#include "host/temporary_root.h"
#include "kv/nesting.h"

namespace tally {
namespace {

constexpr char kDomain[] = "vellum.test";
constexpr char kFile[] = "prefs/vellum.test.plist";

class PreferencesTest : public TemporaryRoot {
 protected:
  PropertyListPreferences open() { return {folder("prefs"), log}; }
  static KvRef<KvObject> number(std::int64_t value) { return KvNumber::int64(value); }
  static WriteResult save(PropertyListPreferences& preferences, std::string_view key,
                          KvRef<KvObject> value) {
    preferences.SMAPreferencesSetValue(key, std::move(value), kDomain);
    return preferences.SMAPreferencesSynchronize(kDomain);
  }
  std::int32_t stored(std::string_view key) {
    return open().SMAPreferencesGetIntegerValue(key, kDomain);
  }
};

TEST_F(PreferencesTest, WritesReachStorageAtSynchroniseOrAtTheEnd) {
  {
    auto preferences = open();
    preferences.SMAPreferencesSetValue("a", number(1), kDomain);
    preferences.SMAPreferencesSetValue("b", number(2), kDomain);
    EXPECT_EQ(preferences.SMAPreferencesGetIntegerValue("a", kDomain), 1);
    EXPECT_FALSE(exists(kFile)) << "written before it was asked for";
    EXPECT_TRUE(preferences.SMAPreferencesSynchronize(kDomain));
    EXPECT_EQ(stored("b"), 2);
    preferences.SMAPreferencesSetValue("a", nullptr, kDomain);
    preferences.SMAPreferencesSetValue("c", number(3), kDomain);
    EXPECT_EQ(preferences.SMAPreferencesGetValue("a", kDomain).get(), nullptr);
    preferences.SMAPreferencesSetValue("other", number(4), "vellum.other");
  }
  const auto preferences = std::make_unique<PropertyListPreferences>(folder("prefs"), log);
  EXPECT_EQ(kvText(preferences->copyDomain(kDomain).get()),
            kvText(KvDictionary::create({{"b", number(2)}, {"c", number(3)}}).get()));
  EXPECT_EQ(*preferences->listDomains(), (std::vector<std::string>{"vellum.other", kDomain}));
  EXPECT_TRUE(errors().empty());
}

TEST_F(PreferencesTest, OnlyWhatChangesIsWritten) {
  const struct {
    const char* name;
    const char* key;
    KvRef<KvObject> former, next;  // null: absent
    bool writes;
  } cases[] = {
      {"the same", "a", number(1), number(1), false},
      {"another width", "a", number(1), KvNumber::int8(1), false},
      {"an integer over a real", "a", KvNumber::float64(1), number(1), true},
      {"an integer that doubles round", "a", KvNumber::float64(9007199254740992.0),
       number(9007199254740993), true},
      {"the empty key", "", number(1), number(2), true},
      {"a key with a slash", "Wi-Fi / Cellular", number(1), number(2), true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove_all(at("prefs"));
    auto preferences = open();
    EXPECT_TRUE(save(preferences, c.key, c.former));
    const auto before = DeviceRoot(root).identity("/" + std::string(kFile));
    EXPECT_EQ(before.has_value(), static_cast<bool>(c.former)) << "a file without a value";
    EXPECT_TRUE(save(preferences, c.key, c.next));
    EXPECT_EQ(DeviceRoot(root).identity("/" + std::string(kFile)) != before, c.writes);
    EXPECT_TRUE(kvIdentical(open().SMAPreferencesGetValue(c.key, kDomain).get(), c.next.get()));
  }
  EXPECT_TRUE(errors().empty());
}

TEST_F(PreferencesTest, SeesAndKeepsWhatOtherProcessesWrite) {
  auto first = open();
  auto second = open();
  EXPECT_EQ(first.SMAPreferencesGetIntegerValue("b", kDomain), 0);
  first.SMAPreferencesSetValue("a", number(1), kDomain);
  EXPECT_TRUE(save(second, "b", number(2)));
  EXPECT_EQ(first.SMAPreferencesGetIntegerValue("b", kDomain), 2) << "a clean key is stale";
  EXPECT_TRUE(first.SMAPreferencesSynchronize(kDomain));
  EXPECT_EQ(second.SMAPreferencesGetIntegerValue("a", kDomain), 1);
  EXPECT_EQ(stored("b"), 2);

  constexpr int kProcesses = 4, kKeys = 25;
  runTogether(kProcesses, kKeys, [this](int process, int i) {
    auto preferences = open();
    return save(preferences, std::to_string(process * 100 + i), number(1));
  });
  EXPECT_EQ(open().copyDomain(kDomain)->size(), 2u + kProcesses * kKeys);
}

TEST_F(PreferencesTest, DamagedFilesAreSetAsideAndTheProgramGoesOn) {
  constexpr int kRounds = 10, kKept = 8;
  for (int round = 1; round <= kRounds; ++round) {
    const std::string damage =
        (round % 2 == 0 ? "<plist><array/></plist>" : "<plist><dict><key>") + std::to_string(round);
    put(kFile, damage);
    auto preferences = open();
    EXPECT_EQ(preferences.SMAPreferencesGetIntegerValue("a", kDomain), 0);
    EXPECT_EQ(preferences.SMAPreferencesGetIntegerValue("a", kDomain), 0);
    EXPECT_EQ(errors().size(), static_cast<std::size_t>(round)) << "one line for each damage";
    EXPECT_TRUE(save(preferences, "a", number(round)));
    EXPECT_EQ(stored("a"), round);
    if (round <= kKept) {
      EXPECT_EQ(get(std::string(kFile) + ".damaged-" + std::to_string(round)), damage);
    }
  }
  EXPECT_EQ(get(std::string(kFile) + ".damaged-1"), "<plist><dict><key>1") << "overwritten";
  EXPECT_EQ(names("prefs").size(), 1u + kKept);
}

TEST_F(PreferencesTest, UnsafeDomainsAreRefused) {
  put("outside.plist", "untouched");
  const std::string_view domains[] = {
      "../outside", "a/b", "", ".", "..", std::string_view("a\0b", 3), "/etc/passwd", "a.tmp~1.0"};
  for (const auto domain : domains) {
    log->lines.clear();
    auto preferences = open();
    preferences.SMAPreferencesSetValue("a", number(1), domain);
    EXPECT_TRUE(preferences.SMAPreferencesSynchronize(domain).isRefused()) << domain;
    EXPECT_FALSE(preferences.SMAPreferencesGetValue("a", domain)) << domain;
    EXPECT_EQ(errors().size(), 3u) << domain;
  }
  EXPECT_EQ(get("outside.plist"), "untouched");
  EXPECT_FALSE(exists("prefs"));
  EXPECT_EQ(userPreferencesFolder(root, "mobile")->text(), at("var/mobile/Library/Preferences"));
  for (const auto user : {"..", "", "a/b"}) EXPECT_FALSE(userPreferencesFolder(root, user));
}

TEST_F(PreferencesTest, AFailedWriteKeepsTheChangesForTheNextAttempt) {
  put("prefs", "a file where the folder should be");
  auto preferences = open();
  EXPECT_FALSE(save(preferences, "a", number(1)));
  EXPECT_FALSE(preferences.SMAPreferencesSynchronize(kDomain).isRefused());
  EXPECT_EQ(errors().size(), 1u) << "said once";
  EXPECT_EQ(preferences.SMAPreferencesGetIntegerValue("a", kDomain), 1);
  std::filesystem::remove(at("prefs"));
  EXPECT_TRUE(preferences.SMAPreferencesSynchronize(kDomain));
  EXPECT_EQ(stored("a"), 1);
}

TEST_F(PreferencesTest, AValueThatNoFileHoldsFailsNoLaterWrite) {
  auto deep = KvArray::create();
  for (int i = 0; i < kMaximumDepth; ++i) deep = KvArray::create({deep});
  auto preferences = open();
  preferences.SMAPreferencesSetValue("deep", deep, kDomain);
  EXPECT_TRUE(save(preferences, "a", number(1)).isRefused());
  EXPECT_FALSE(exists(kFile)) << "half of what belongs together";
  EXPECT_TRUE(save(preferences, "a", number(2)));
  EXPECT_EQ(stored("a"), 2);
  EXPECT_EQ(errors().size(), 1u);
}

}  // namespace
}  // namespace tally
