// The whitelist: what is admitted, by which entry, and what a damaged file still admits.
#include "config/whitelist.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

#include "config/rounding_outputs.h"
#include "fakes/fake_platform.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kNotAdmitted = "-";

std::string plist(std::string_view body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + std::string(body) +
         "</plist>\n";
}

std::string group(std::string_view name, std::string_view sections) {
  return "<key>" + std::string(name) + "</key><dict>" + std::string(sections) + "</dict>";
}

std::string section(std::string_view name, std::string_view keys) {
  return "<key>" + std::string(name) + "</key><dict>" + std::string(keys) + "</dict>";
}

// A key whose options have a figure, which identifies the entry that answered.
std::string entry(std::string_view key, int figure) {
  return "<key>" + std::string(key) + "</key><dict><key>sig_fig</key><integer>" +
         std::to_string(figure) + "</integer></dict>";
}

class WhitelistTest : public testing::Test {
 protected:
  // The whitelist keeps the log alone, so the platform may go.
  std::unique_ptr<Whitelist> load() {
    Platform platform = fake.services();
    return Whitelist::load(platform);
  }
  std::unique_ptr<Whitelist> load(const std::string& groups) {
    fake.files->contents[std::string(kWhitelistPath)] = plist("<dict>" + groups + "</dict>");
    return load();
  }
  static std::string figureOf(const ScalarOptions* options) {
    return options == nullptr ? kNotAdmitted : kvText(options->get("sig_fig"));
  }

  fakes::FakePlatform fake = fakes::makeFakePlatform();
};

TEST_F(WhitelistTest, TheMostSpecificEntryAnswers) {
  const auto config = load(
      group("A", section("ScalarKeys", entry("net.wifi.rx", 1) + "<key>net.bare</key><dict/>") +
                     section("ScalarKeyPrefixes", entry("net.", 2) + entry("net.wifi.", 3))) +
      group("B", section("ScalarKeyPrefixes", entry("net.wifi.rx.", 4) + entry("n", 5)) +
                     section("DistributionKeys", entry("lat", 6)) +
                     section("DistributionKeyPrefixes", entry("net.", 7))));
  ASSERT_TRUE(config);
  const struct {
    const char* key;
    const char* scalar;
    const char* distribution;
  } cases[] = {
      {"net.wifi.rx", "1", "7"},
      {"net.wifi.tx", "3", "7"},
      {"net.wifi.rx.bytes", "4", "7"},
      {"net.wifi.", "3", "7"},
      {"net.wifi", "2", "7"},
      {"net.cell", "2", "7"},
      {"net.bare", "(null)", "7"},
      {"Net.cell", "-", "-"},
      {"lat", "-", "6"},
      {"late", "-", "-"},
      {"net.wifi.rx\xC3\xA9", "3", "7"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(figureOf(config->scalarOptions(c.key)), c.scalar) << c.key;
    EXPECT_EQ(figureOf(config->distributionOptions(c.key)), c.distribution) << c.key;
  }
  EXPECT_TRUE(fake.log->has(LogLevel::Debug, "prefix match net.wifi. for net.wifi.tx"));
}

TEST_F(WhitelistTest, TheLastGroupOfTheFileWins) {
  const auto config = load(group("Z", section("ScalarKeys", entry("k", 1))) +
                           group("A", section("ScalarKeys", entry("k", 2))));
  EXPECT_EQ(figureOf(config->scalarOptions("k")), "2");
  EXPECT_EQ(config->matchScalarKey("k").group, "A");
}

TEST_F(WhitelistTest, GroupsAreSwitchedByTaskingAndByTheKindOfDevice) {
  const std::string groups = group("InternalTesting", section("ScalarKeys", entry("internal", 1))) +
                             group("Radio", section("ScalarKeys", entry("radio", 2)));
  const struct {
    const char* name;
    bool internal;
    KvRef<KvObject> radioSwitch;
    const char* internalKey;
    const char* radioKey;
    const char* unlisted;
    bool disabledLogged;
    bool unreadable = false;
  } cases[] = {
      {"production", false, nullptr, "-", "2", "-", false},
      {"switched off", false, KvBoolean::of(false), "-", "-", "-", true},
      {"switched off by a number", false, KvNumber::int32(0), "-", "-", "-", true},
      {"a switch that is not a boolean", false, KvString::create("no"), "-", "2", "-", false},
      {"switches that cannot be read", false, nullptr, "-", "-", "-", false, true},
      {"internal", true, nullptr, "1", "2", "(null)", false},
      {"internal, switched off", true, KvBoolean::of(false), "1", "2", "(null)", false},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    fake = fakes::makeFakePlatform();
    fake.deviceInformation->answers["InternalBuild"] = KvBoolean::of(c.internal);
    fake.preferences->put("Radio", c.radioSwitch, "vellum.da");
    if (c.unreadable) fake.preferences->unreadableDomain = "vellum.da";
    const auto config = load(groups);
    EXPECT_EQ(figureOf(config->scalarOptions("internal")), c.internalKey);
    EXPECT_EQ(figureOf(config->scalarOptions("radio")), c.radioKey);
    EXPECT_EQ(figureOf(config->scalarOptions("unlisted")), c.unlisted);
    EXPECT_EQ(fake.log->has(LogLevel::Default, "keyGroup Radio is disabled by tasking"),
              c.disabledLogged);
    EXPECT_EQ(
        fake.log->has(LogLevel::Debug, "passing @{} for unlisted as device is Orrery Internal"),
        c.internal);
  }
}

TEST_F(WhitelistTest, AMalformedPartIsSkippedAlone) {
  const auto config = load(
      "<key>NoDictionary</key><array/>" +
      group("G", "<key>ScalarKeys</key><string>x</string><key>Comment</key><string>y</string>" +
                     section("DistributionKeys",
                             entry("good", 1) + "<key>bad</key><integer>1</integer>" +
                                 "<key>half</key><dict><key>sig_fig</key><integer>2</integer>"
                                 "<key>intervals</key><array><string>1</string></array>"
                                 "<key>bucket_interval</key><integer>-5</integer></dict>"
                                 "<key>odd</key><dict><key>sig_fig</key><real>1.5</real></dict>")));
  ASSERT_TRUE(config);
  EXPECT_EQ(figureOf(config->distributionOptions("good")), "1");
  EXPECT_EQ(config->distributionOptions("bad"), nullptr);
  const auto* half = config->distributionOptions("half");
  EXPECT_EQ(figureOf(half), "2");
  EXPECT_EQ(half->size(), 1u);
  EXPECT_THAT(
      fake.log->texts(LogLevel::Error),
      ElementsAre(
          "whitelist: malformed group NoDictionary skipped",
          "whitelist: group G: malformed section ScalarKeys skipped",
          "whitelist: group G, DistributionKeys: malformed options of key bad, skipped",
          "whitelist: group G, DistributionKeys, key half: malformed option intervals "
          "skipped",
          "whitelist: group G, DistributionKeys, key half: malformed option "
          "bucket_interval skipped",
          "whitelist: group G, DistributionKeys, key odd: malformed option sig_fig skipped"));
}

TEST_F(WhitelistTest, WhatCannotBeLoadedAdmitsNothing) {
  EXPECT_EQ(load(), nullptr);
  EXPECT_THAT(fake.log->texts(LogLevel::Error), ElementsAre("Couldn't load whitelist"));
  for (const std::string& text : {plist("<array/>"), std::string("garbage"), std::string()}) {
    fake.log->lines.clear();
    fake.files->contents[std::string(kWhitelistPath)] = text;
    EXPECT_EQ(load(), nullptr) << text;
    EXPECT_THAT(
        fake.log->texts(LogLevel::Error),
        ElementsAre(testing::StartsWith("Couldn't parse the contents of the config file. Error: ")))
        << text;
  }
}

TEST_F(WhitelistTest, TheDigestIsOfTheBytesAsRead) {
  fake.files->contents[std::string(kWhitelistPath)] = "<plist version=\"1.0\"><dict/></plist>";
  const auto config = load();
  ASSERT_TRUE(config);
  EXPECT_EQ(config->fileDigest(), "be5a5e8f37d7f11fc2c74e4372ebb8f0");
  EXPECT_EQ(config->scalarOptions("k"), nullptr);
  EXPECT_THAT(fake.log->lines, IsEmpty());
}

TEST(WhitelistOptions, RoundingOfScalars) {
  constexpr std::int64_t kMaximum = INT64_MAX, kMinimum = INT64_MIN;
  const struct {
    std::int64_t value;
    std::optional<std::int64_t> interval, figures;
    std::int64_t expected;
    bool haveEffect = true;
  } cases[] = {
      {123456, {}, 2, 120000},
      {-1550, {}, 2, -1600},
      {95, {}, 1, 100},
      {1, {}, 0, 1},
      {100, {}, 1, 100},
      {105, {}, 2, 110},
      {123, {}, 4294967295, 123, false},
      {123, {}, 18, 123},
      {123, {}, 19, 123, false},
      {14, 10, {}, 10},
      {15, 10, {}, 20},
      {-15, 10, {}, -10},
      {7, 0, {}, 7, false},
      {7, 1, {}, 7, false},
      {5, 3, {}, 6},
      {123, 10, 2, 120},
      {7, {}, {}, 7, false},
      // The ends of the range saturate instead of wrapping.
      {kMaximum, 10, {}, 9223372036854775800},
      {kMinimum, 10, {}, -9223372036854775800},
      {kMinimum, 4294967295, {}, -9223372034707292160},
      {kMaximum, {}, 0, kMaximum},
      {kMinimum, {}, 1, -9000000000000000000},
  };
  for (const auto& c : cases) {
    auto options = KvDictionary::create();
    if (c.interval) options->set("bucket_interval", KvNumber::int64(*c.interval));
    if (c.figures) options->set("sig_fig", KvNumber::int64(*c.figures));
    EXPECT_EQ(roundScalar(c.value, *options), c.expected) << c.value << kvText(options.get());
    EXPECT_EQ(haveEffect(*options), c.haveEffect) << kvText(options.get());
  }
}

// By counting, where that is possible.
TEST(WhitelistOptions, OutputsAreCountedWithoutMakingThem) {
  const std::pair<std::int64_t, std::int64_t> ranges[] = {
      {0, 0}, {-7, 5}, {95, 1105}, {-2345, -90}, {-1200, 1999}, {9990, 11011}, {98765, 101011}};
  for (const std::int64_t interval : {-1, 0, 1, 2, 7, 10, 64, 999, 1000, 5000}) {
    for (const std::int64_t figures : {-1, 0, 1, 2, 3, 4, 19}) {
      auto options = KvDictionary::create();
      if (interval >= 0) options->set("bucket_interval", KvNumber::int64(interval));
      if (figures >= 0) options->set("sig_fig", KvNumber::int64(figures));
      for (const auto& [lowest, highest] : ranges) {
        std::set<std::int64_t> outputs;
        for (auto value = lowest; value <= highest; ++value) {
          outputs.insert(roundScalar(value, *options));
        }
        EXPECT_EQ(outputsBetween(lowest, highest, *options), static_cast<double>(outputs.size()))
            << lowest << " to " << highest << kvText(options.get());
      }
    }
  }
  const auto none = KvDictionary::create();
  EXPECT_EQ(outputsBetween(INT64_MIN, INT64_MAX, *none), 18446744073709551616.0);
  auto figures = KvDictionary::create();
  figures->set("sig_fig", KvNumber::int64(2));
  // 0, and for each sign 1 to 99, then 10 to 99 of 16 powers of ten, then 10 to 92.
  EXPECT_EQ(outputsBetween(INT64_MIN, INT64_MAX, *figures), 1 + 2 * (99 + 90 * 16 + 83));
}

}  // namespace
}  // namespace tally
