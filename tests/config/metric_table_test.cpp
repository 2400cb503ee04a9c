// The metrics tables of a device: which entry answers, and what a damaged file still says.
#include "config/metric_table.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "fakes/temporary_folder.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

const std::string kFolder = "Library/Application Support/Tallybook/";

class MetricTableTest : public testing::Test, protected TemporaryFolder {
 protected:
  void putTable(const std::string& name, const std::string& entries) const {
    put(kFolder + name, "<plist version=\"1.0\"><dict><key>Metrics</key><array>" + entries +
                            "</array></dict></plist>");
  }
  static std::string entry(const std::string& kind, const std::string& key, const std::string& unit,
                           const std::string& type = "gauge") {
    return "<dict>" + field(kind, key) + field("Unit", unit) + field("Type", type) + "</dict>";
  }
  static std::string field(const std::string& name, const std::string& text) {
    return "<key>" + name + "</key><string>" + text + "</string>";
  }
  MetricTable load() {
    faults.clear();
    return MetricTable::load(DeviceRoot(root),
                             [this](const std::string& fault) { faults.push_back(fault); });
  }
  std::vector<std::string> faults;
};

TEST_F(MetricTableTest, TheMostSpecificAndTheLastEntryAnswers) {
  EXPECT_TRUE(load().empty());
  EXPECT_THAT(faults, ElementsAre());
  putTable("Metrics.plist", entry("Key", "net.wifi", "key") + entry("Prefix", "net.", "n") +
                                entry("Prefix", "net.w", "nw", "counter") +
                                entry("Prefix", "", "all", "distribution"));
  putTable("Metrics.d/b.plist", entry("Key", "disk", "b") + entry("Key", "net", "first"));
  putTable("Metrics.d/a.plist", entry("Key", "disk", "a"));
  putTable("Metrics.d/c.txt", "not read");
  const MetricTable table = load();
  EXPECT_THAT(faults, ElementsAre());
  EXPECT_THAT(table.files(),
              ElementsAre("Metrics.plist", "Metrics.d/a.plist", "Metrics.d/b.plist"));
  const struct {
    const char *key, *unit, *source;
  } cases[] = {{"net.wifi", "key", "Metrics.plist"}, {"net.wifi.rx", "nw", "Metrics.plist"},
               {"net.x", "n", "Metrics.plist"},      {"net", "first", "Metrics.d/b.plist"},
               {"other", "all", "Metrics.plist"},    {"disk", "b", "Metrics.d/b.plist"}};
  for (const auto& c : cases) {
    const Metric* const metric = table.find(c.key);
    ASSERT_NE(metric, nullptr) << c.key;
    EXPECT_EQ(metric->unit, c.unit) << c.key;
    EXPECT_EQ(metric->source, c.source) << c.key;
  }
  const struct {
    const char* prefix;
    std::size_t metrics, scalars, distributions;
  } below[] = {{"", 6, 5, 1}, {"net", 4, 4, 0}, {"net.w", 2, 2, 0}, {"zz", 0, 0, 0}};
  for (const auto& c : below) {
    const auto found = table.below(c.prefix);
    EXPECT_EQ(found.metrics, c.metrics) << c.prefix;
    EXPECT_EQ(found.scalars, c.scalars) << c.prefix;
    EXPECT_EQ(found.distributions, c.distributions) << c.prefix;
  }
}

TEST_F(MetricTableTest, WhatIsMalformedIsNamedAndTheRestIsUsed) {
  const std::string sound = entry("Key", "sound", "s");
  const struct {
    std::string entries, fault;
  } cases[] = {
      {"<string>x</string>", "Metrics.plist: entry 1 is not a dictionary"},
      {"<dict/>", "entry 1 has not exactly one of Key and Prefix"},
      {"<dict>" + field("Key", "k") + field("Prefix", "k") + "</dict>", "not exactly one"},
      {"<dict>" + field("Key", "") + "</dict>", "not exactly one"},
      {"<dict><key>Key</key><true/></dict>", "not exactly one"},
      {entry("Key", "k", "s", "histogram"), "entry 1, k, has a Type other than counter, gauge"},
      {entry("Key", "k", std::string(33, 'u')), "entry 1, k, has a Unit that is not a text of at"},
      {"<dict>" + field("Key", "k") + "<key>Description</key><array/></dict>", "has a Description"},
  };
  for (const auto& c : cases) {
    putTable("Metrics.plist", c.entries + sound);
    const MetricTable table = load();
    EXPECT_THAT(faults, ElementsAre(HasSubstr(c.fault)));
    EXPECT_NE(table.exact("sound"), nullptr) << c.fault;
  }
  // A file that cannot be used leaves the others.
  putTable("Metrics.d/a.plist", sound);
  for (const char* content : {"damaged", "<plist version=\"1.0\"><array/></plist>"}) {
    put(kFolder + "Metrics.plist", content);
    const MetricTable table = load();
    EXPECT_THAT(faults, ElementsAre(HasSubstr("Metrics.plist: ")));
    EXPECT_THAT(table.files(), ElementsAre("Metrics.d/a.plist"));
  }
}

}  // namespace
}  // namespace tally
