// tallyctl explain: each way in which a key reaches the log, or does not.
#include "report/daily_report.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

class ExplainCommand : public ToolTest {
 protected:
  void SetUp() override {
    putPlist("device/device/device.plist",
             "<dict>" +
                 dict("KernelValues",
                      integer("kern.memorystatus_thaw_count", "31") +
                          integer("kern.memorystatus_freezer_process_considered_count", "0") +
                          integer("kern.memorystatus_freezer_error_other_count", "2")) +
                 "</dict>");
    putWhitelist(
        dict("G", dict("ScalarKeys",
                       dict("a", integer("bucket_interval", "10") + integer("sig_fig", "2")) +
                           dict("empty", "") + dict("vellum.kernel.memorystatus_thaw_count", "") +
                           dict("vellum.memorystatus_freezer_error_other_count", "")) +
                      dict("DistributionKeys", dict("d", intervals({"2"})))) +
        dict("Off", dict("ScalarKeyPrefixes", dict("off.", ""))) +
        dict("InternalTesting", dict("ScalarKeys", dict("secret", ""))));
    putPlist("device/var/mobile/Library/Preferences/vellum.da.plist",
             "<dict><key>Off</key><false/></dict>");
    putRows(
        "scalar,a,19999,,7\nscalar,a,20000,,1236\nscalar,ab,20000,,1\nscalar,off.x,20000,,1\n"
        "scalar,secret,20000,,1\nscalar,both,20000,,1\nscalar,d,20001,,1\n"
        "distribution,d,20000,1,1\ndistribution,d,20000,2,3\ndistribution,both,20000,1,1\n"
        "scalar,a,20003,,5\n");
  }
};

TEST_F(ExplainCommand, TellsWhereAKeyStandsOrWhyNot) {
  const struct {
    const char* key;
    int status;
    std::vector<std::string> parts;  // of the text, in any order
    const char* day = "20000";
  } cases[] = {
      {"a",
       kSuccess,
       {"2024-10-03       7\n", "2024-10-04   1,236\n", "bucket_interval 10: 1,236 becomes 1,240",
        "sig_fig 2: 1,240 becomes 1,200", "made now\n  scalar 1,200\n",
        "no log of that day was submitted"}},
      {"d",
       kSuccess,
       {"admitted  as a distribution: the group G lists it", "options: intervals of 1 number",
        "distribution of 2 samples: min 1, mean 2, std dev 1, max 3", "(-inf, 2]", "(2, inf)",
        "not there as a scalar: the store has no such row"}},
      {"ab", kWrong, {"refused  as a scalar: it is not listed", "whitelist refuses it"}},
      {"secret", kWrong, {"InternalTesting, which is for internal devices only"}},
      {"empty", kWrong, {"no rows of this key", "the store has no such row on that day"}},
      {"vellum.kernel.memorystatus_thaw_count",
       kSuccess,
       {"the report measures this key itself", "measured now  31", "scalar 31"}},
      {"vellum.kernel.memorystatus_thaw_count",
       kWrong,
       {"no log is made and nothing is measured"},
       "20002"},
      {"vellum.memorystatus_freezer_error_other_count",
       kWrong,
       {"it cannot be measured: a count that it needs cannot be read, or is 0"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.key) + " on " + c.day);
    const Outcome outcome = run({"explain", c.key, "--day", c.day});
    EXPECT_EQ(outcome.status, c.status);
    for (const std::string& part : c.parts) EXPECT_THAT(outcome.out, HasSubstr(part));
  }
}

TEST_F(ExplainCommand, ComparesWithWhatWasSubmitted) {
  {
    const PlatformScope scope(makeLinuxPlatform(at("device"), {log, false}));
    writeDailyLog(platform(), 20000, nullptr);
    writeDailyLog(platform(), 20003, nullptr);
  }
  EXPECT_THAT(run({"explain", "d", "--day", "20000"}).out, HasSubstr("the same distribution"));
  putWhitelist(dict("G", dict("ScalarKeys", dict("b", ""))));
  const Outcome outcome = run({"explain", "a", "--day", "20000"});
  EXPECT_EQ(outcome.status, kWrong);
  EXPECT_THAT(outcome.out, HasSubstr("0000000001-log-tallyd.log\n  scalar 1,200\n"));
  EXPECT_THAT(outcome.out, HasSubstr("it was made with another whitelist"));
  const auto json = run({"explain", "a", "--day", "20000", "--json"}).json();
  EXPECT_EQ(json["submittedLog"]["scalar"], 1200);
  EXPECT_EQ(json["nextLog"], nullptr);
  EXPECT_EQ(json["scalarRows"][1]["value"], 1236);
  EXPECT_EQ(json["whyAbsent"]["scalar"], "the whitelist refuses it");
}

}  // namespace
}  // namespace tally::tools
