// Units and descriptions: where they are shown, and what a check makes of them.
#include "tools/metrics/known_metrics.h"
#include "tools/metrics/unit_scale.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;
using testing::Not;

const std::string kMetrics = "device/Library/Application Support/Tallybook/Metrics.plist";

class MetricsOfDevice : public ToolTest {
 protected:
  void putMetrics(const std::string& entries) const {
    putList(kMetrics, R"({"Metrics": [)" + entries + "]}");
  }
  // "KEY: MESSAGE" for each finding.
  std::vector<std::string> findings(int status) {
    const Outcome outcome = run({"whitelist", "check", "--json"});
    EXPECT_EQ(outcome.status, status);
    std::vector<std::string> lines;
    const auto document = outcome.json();
    for (const auto& finding : document["findings"]) {
      lines.push_back(finding.value("key", finding.value("group", "")) + ": " +
                      finding["message"].get<std::string>());
    }
    return lines;
  }
};

TEST_F(MetricsOfDevice, TheSystemKnowsItsOwnKeys) {
  const KnownMetrics metrics{MetricTable()};
  const struct {
    const char *key, *text;
  } cases[] = {
      {"vellum.hwreport.disk2.written", "counter, in KiB: data that was written"},
      {"vellum.hwreport.disk#.written", "counter, in KiB: data that was written"},
      {"vellum.hwreport.net0.errors",
       "counter, in events: faulty packets that were received, and packets that could not be sent"},
      {"vellum.hwreport.wakeup.usb.wakeups",
       "counter, in events: times that it may have ended or "
       "prevented a sleep"},
      {"vellum.hwreport.day.span",
       "counter, in s: the wall clock; its amount is the time over "
       "which the amounts of the day were counted"},
      {"vellum.usage.cur_boot_session_cpu_uptime", "gauge, in minutes: time since boot"},
      {"vellum.tallyd.refused.memory", "counter, in refusals: no memory left within the limit"},
      {"vellum.NANDInfo.ueccReads", "gauge, in reads: reads that could not be corrected"},
      {"vellum.NANDInfo.SectorsPerHostFlow3", "gauge, in sectors: flash storage: Traffic"},
      {"vellum.NANDInfo.of.a.later.driver", "figure of the flash storage"},
      {"vellum.hwreport.disk.written", ""},
      {"vellum.hwreport.diskx.written", ""},
      {"vellum.hwreport.wakeup.usb.x.wakeups", ""},
      {"vellum.hwreport.", ""},
      {"other.disk2.written", ""},
  };
  for (const auto& c : cases) {
    const Metric* const metric = metrics.find(c.key);
    EXPECT_EQ(metric != nullptr ? metricText(*metric) : "", c.text) << c.key;
  }
  EXPECT_EQ(metrics.below("vellum.hwreport.disk3.").metrics, 7u);
}

TEST_F(MetricsOfDevice, BoundariesInAnotherUnit) {
  const struct {
    const char* unit;
    double first, last;
    SampleRange samples;
    const char* meant;  // empty: nothing is said
  } cases[] = {
      {"ms", 1, 10, {1200, 8000, 3000, 100}, "s"},
      {"milliseconds", 1, 10, {1200, 8000, 3000, 100}, "s"},
      {"s", 100, 5000, {0.12, 4, 0.9, 100}, "ms"},
      {"s", 5, 5, {30, 900, 200, 100}, "min"},
      {"bytes", 1, 64, {3e6, 4e7, 1e7, 100}, "MiB"},
      {"ms", 1, 10, {9, 8000, 3000, 100}, ""},   // some are between them
      {"ms", 1, 10, {11, 40, 20, 100}, ""},      // only slow
      {"s", 1, 10, {15, 100, 40, 100}, ""},      // also in minutes few would be
      {"ms", 1, 10, {1200, 8000, 3000, 9}, ""},  // too few
      {"percent", 1, 10, {1200, 8000, 3000, 99}, ""},
      {"s", 0, 0, {1, 2, 1.5, 100}, ""},
  };
  for (const auto& c : cases) {
    const UnitScale* const own = unitScale(c.unit);
    const UnitScale* const meant =
        own != nullptr ? likelierUnit(*own, c.first, c.last, c.samples) : nullptr;
    EXPECT_EQ(meant != nullptr ? meant->name : "", c.meant) << c.unit << ' ' << c.samples.mean;
  }
}

TEST_F(MetricsOfDevice, ACheckFindsWhatContradictsThem) {
  putWhitelist(R"({"G": {"DistributionKeys": {"calls": {"intervals": [1]}, "wait": {"intervals":
      [1, 10]}, "new": {}}, "DistributionKeyPrefixes": {"app.": {}},
      "ScalarKeys": {"wait": {"sig_fig": 2}}, "ScalarKeyPrefixes": {"app.": {}}}})");
  std::string rows =
      "scalar,both,20000,,1\ndistribution,both,20001,1,1\nscalar,wait,20000,,1\n"
      "scalar,app.x,20000,,1\n";
  for (int i = 0; i < 10; ++i) rows += fmt::format("distribution,wait,20000,{},{}\n", i, 1200 + i);
  putRows(rows);
  const std::string twoTypes = "recorded as two types: as a scalar, last on ";
  EXPECT_THAT(findings(kSuccess),
              testing::ElementsAre(HasSubstr("both: " + twoTypes + "2024-10-04, and as a"),
                                   HasSubstr("wait: " + twoTypes)));
  putMetrics(R"({"Key": "calls", "Type": "counter"}, {"Key": "both"}, {"Prefix": "app.", "Type":
      "distribution"}, {"Key": "wait", "Type": "distribution", "Unit": "ms"}, 7)");
  EXPECT_THAT(
      findings(kWrong),
      testing::Pointwise(
          Begins(),
          std::vector<std::string>{
              "calls: Metrics.plist calls it a counter, which has no histogram",
              "wait: Metrics.plist calls it a distribution, which is not reported as a scalar",
              "app.: Metrics.plist calls it a distribution, which is not reported as a scalar",
              "G: 1 entry that no metrics table describes: new",
              "app.x: recorded as a scalar, last on 2024-10-04; Metrics.plist calls it a distri",
              "both: " + twoTypes,
              "wait: " + twoTypes + "2024-10-04, and as a distribution, last on 2024-10-04; Metr",
              "wait: all 10 samples of wait, from 1,200 to 1,209 ms, are above the last boundary, "
              "10; the boundaries may be in s",
              ": Metrics.plist: entry 5 is not a dictionary"}));
  EXPECT_THAT(run({"whitelist", "check"}).out,
              HasSubstr("  metrics: 3 keys and 1 prefix in Metrics.plist\n"));
  EXPECT_THAT(run({"explain", "wait"}).out,
              HasSubstr("\ndistribution, in ms\nthe store has it as a scalar\n"));
}

TEST_F(MetricsOfDevice, UnitsAndDescriptionsAreShown) {
  putWhitelist(R"({"G": {"ScalarKeys": {"a": {}, "b": {}, "p.x": {}, "p.y": {}},
                         "DistributionKeys": {"d": {"intervals": [2]}}}})");
  putRows(
      "scalar,a,20000,,1700\nscalar,b,20000,,5\nscalar,p.x,20000,,1\nscalar,p.y,20000,,2\n"
      "distribution,d,20000,1,2\n");
  submit(20000);
  const Outcome bare = run({"report", "show"}), bareJson = run({"report", "show", "--json"});
  EXPECT_THAT(bare.out, Not(HasSubstr("unit")));
  EXPECT_FALSE(bareJson.json().contains("metrics"));
  putMetrics(R"({"Key": "a", "Type": "counter", "Unit": "ms", "Description": "time\u0007 spent"},
      {"Key": "d", "Unit": "°C"}, {"Prefix": "p.", "Description": "of p"})");
  expectParts(run({"report", "show"}).out,
              {"  key  value  unit\n  a    1,700  ms\n    time", " spent\n  b        5\n",
               "  p.x      1\n    of p\n  p.y      2\n",
               "max  unit\n  d        1    2     2        0    2  °C\n", "  d, in °C\n"});
  expectValues(run({"report", "show", "--json"}).json(), R"({"/metrics/a/unit": "ms",
      "/metrics/b": "absent", "/metrics/d/type": null, "/metrics/p.y/description": "of p"})");
  expectParts(run({"explain", "a", "--day", "20000"}).out,
              {"\ncounter, in ms: time", "2024-10-04  1,700 ms\n", "stored  1,700 ms\n",
               "made now\n  scalar 1,700 ms\n"});
  expectValues(run({"explain", "a", "--day", "20000", "--json"}).json(),
               R"({"/metric/type": "counter", "/metric/unit": "ms"})");
  EXPECT_THAT(run({"explain", "d", "--day", "20000"}).out, HasSubstr("std dev 0, max 2 °C\n"));
}

}  // namespace
}  // namespace tally::tools
