// The whitelist: what is admitted, by which entry, and what a damaged file costs.
#include "config/whitelist.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

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

// A key whose options carry a figure by which a test can tell which entry answered.
std::string entry(std::string_view key, int figure) {
  return "<key>" + std::string(key) + "</key><dict><key>sig_fig</key><integer>" +
         std::to_string(figure) + "</integer></dict>";
}

class ConfigTest : public testing::Test {
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

TEST_F(ConfigTest, TheMostSpecificEntryAnswers) {
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

TEST_F(ConfigTest, TheLastGroupOfTheFileWins) {
  const auto config = load(group("Z", section("ScalarKeys", entry("k", 1))) +
                           group("A", section("ScalarKeys", entry("k", 2))));
  EXPECT_EQ(figureOf(config->scalarOptions("k")), "2");
  EXPECT_EQ(config->matchScalarKey("k").entry->group->view(), "A");
}

TEST_F(ConfigTest, GroupsAreSwitchedByTaskingAndByTheKindOfDevice) {
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
      {"a switch that is no boolean", false, KvString::create("no"), "-", "2", "-", false},
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

TEST_F(ConfigTest, AMalformedPieceCostsOnlyItself) {
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

TEST_F(ConfigTest, WhatCannotBeLoadedAdmitsNothing) {
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

TEST_F(ConfigTest, TheDigestIsOfTheBytesAsRead) {
  fake.files->contents[std::string(kWhitelistPath)] = "<plist version=\"1.0\"><dict/></plist>";
  const auto config = load();
  ASSERT_TRUE(config);
  EXPECT_EQ(config->fileDigest(), "be5a5e8f37d7f11fc2c74e4372ebb8f0");
  EXPECT_EQ(config->scalarOptions("k"), nullptr);
  EXPECT_THAT(fake.log->lines, IsEmpty());
}

}  // namespace
}  // namespace tally
