// tallyctl whitelist and explain: what is found in a file, and what is said of a key.
#include "report/daily_report.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::ElementsAreArray;
using testing::HasSubstr;

class WhitelistCommands : public ToolTest {
 protected:
  // "fault PLACE: MESSAGE" for each finding.
  std::vector<std::string> findings() {
    const Outcome outcome = run({"whitelist", "check", "--json"});
    std::vector<std::string> lines;
    bool fault = false;
    const auto document = outcome.json();
    for (const auto& finding : document["findings"]) {
      std::string place;
      for (const char* level : {"group", "section", "key", "option"}) {
        if (finding.contains(level)) place += "/" + finding[level].get<std::string>();
      }
      fault = fault || finding["severity"] == "fault";
      lines.push_back(finding["severity"].get<std::string>() + " " + place + ": " +
                      finding["message"].get<std::string>());
    }
    EXPECT_EQ(outcome.status, fault ? kWrong : kSuccess);
    return lines;
  }
};

std::string scalar(const std::string& options) {
  return dict("G", dict("ScalarKeys", dict("k", options)));
}
std::string distribution(const std::string& options) {
  return dict("G", dict("DistributionKeys", dict("k", options)));
}

TEST_F(WhitelistCommands, CheckFindsFaultsAndSurprises) {
  const std::string longKey(513, 'k');
  const struct {
    std::string groups;
    std::vector<std::string> found;  // the beginning of each finding
  } cases[] = {
      {scalar(integer("sig_fig", "2")), {}},
      // Pieces of the wrong type.
      {"<key>G</key><array/>", {"fault /G: not a dictionary"}},
      {"<key>G</key><dict><key>ScalarKeys</key><true/></dict>",
       {"fault /G/ScalarKeys: not a dictionary"}},
      {scalar(integer("sig_fig", "-1")), {"fault /G/ScalarKeys/k/sig_fig: not a whole number"}},
      // Names that nobody reads.
      {dict("G", dict("ScalarKey", dict("a", "")) + dict("ScalarKeys", dict("b", ""))),
       {"fault /G/ScalarKey: no section"}},
      {scalar(integer("sigfigs", "2")), {"fault /G/ScalarKeys/k/sigfigs: no option"}},
      // Rounding that does nothing, or more than it seems.
      {scalar(integer("bucket_interval", "0")), {"fault /G/ScalarKeys/k/bucket_interval: a step"}},
      {scalar(integer("sig_fig", "0")), {"surprise /G/ScalarKeys/k/sig_fig: no figure"}},
      {scalar(integer("sig_fig", "19")), {"surprise /G/ScalarKeys/k/sig_fig: no value has more"}},
      {scalar(integer("bucket_interval", "5") + integer("sig_fig", "2")),
       {"surprise /G/ScalarKeys/k: has both"}},
      {scalar(intervals({"1"})), {"surprise /G/ScalarKeys/k/intervals: scalars have"}},
      {distribution(integer("sig_fig", "2")),
       {"surprise /G/DistributionKeys/k/sig_fig: distributions are not"}},
      // Boundaries.
      {distribution(intervals({"1", "3", "2", "3", "4"})),
       {"fault /G/DistributionKeys/k/intervals: boundary 3, 2, is below",
        "fault /G/DistributionKeys/k/intervals: boundary 4, 3, is there twice"}},
      {distribution(intervals({"1", "nan", "2"})),
       {"fault /G/DistributionKeys/k/intervals: boundary 2 is not a number"}},
      {distribution(intervals({})), {"surprise /G/DistributionKeys/k/intervals: no boundary"}},
      // Entries beside each other.
      {dict("A", dict("ScalarKeys", dict("k", integer("sig_fig", "2")))) + scalar(""),
       {"surprise /G/ScalarKeys/k: the group A lists it too, with sig_fig 2; the later"}},
      {dict("G", dict("ScalarKeyPrefixes", dict("n.", "") + dict("n.w.", ""))),
       {"surprise /G/ScalarKeyPrefixes/n.w.: says the same as the prefix n."}},
      {dict("G", dict("ScalarKeyPrefixes", dict("n.", integer("sig_fig", "1"))) +
                     dict("ScalarKeys", dict("n.x", ""))),
       {"surprise /G/ScalarKeys/n.x: reported without options, though"}},
      {dict("G", dict("ScalarKeyPrefixes", dict("n.", "")) + dict("ScalarKeys", dict("n.", ""))),
       {"surprise /G/ScalarKeys/n.: the group G has a prefix of the same text"}},
      {dict("G", dict("DistributionKeyPrefixes", dict("", ""))),
       {"surprise /G/DistributionKeyPrefixes: the empty prefix admits every distribution"}},
      {dict("G", dict("ScalarKeys", dict("", "") + dict(longKey, ""))),
       {"fault /G/ScalarKeys: no key of the store can match",
        "fault /G/ScalarKeys/" + longKey + ": no key"}},
      // Groups.
      {dict("G", ""), {"surprise /G: the group admits no key"}},
      {dict("InternalTesting", dict("ScalarKeyPrefixes", dict("", ""))) + scalar(""),
       {"surprise /InternalTesting: not in force here: it is for internal devices only",
        "surprise /InternalTesting/ScalarKeyPrefixes: the empty prefix"}},
      {dict("Off", dict("ScalarKeys", dict("k", ""))),
       {"surprise /Off: not in force here: it is disabled by tasking"}},
      {dict("Odd", dict("ScalarKeys", dict("k", ""))),
       {"surprise /Odd: its switch in the preferences vellum.da is not a boolean"}},
  };
  putPlist("device/var/mobile/Library/Preferences/vellum.da.plist",
           "<dict><key>Off</key><false/><key>Odd</key><string>no</string></dict>");
  for (const auto& c : cases) {
    SCOPED_TRACE(c.groups.substr(0, 200));
    putWhitelist(c.groups);
    std::vector<testing::Matcher<std::string>> wanted;
    for (const std::string& begin : c.found) wanted.push_back(testing::StartsWith(begin));
    EXPECT_THAT(findings(), ElementsAreArray(wanted));
  }
}

TEST_F(WhitelistCommands, AFileThatCannotBeUsedIsAFault) {
  EXPECT_THAT(findings(), testing::ElementsAre(HasSubstr("No such file")));
  putWhitelist("<key>");
  EXPECT_THAT(findings(), testing::ElementsAre(HasSubstr("the file cannot be used")));
  putWhitelist(scalar(""));
  EXPECT_EQ(run({"whitelist", "check", at("nowhere")}).status, kWrong);
}

TEST_F(WhitelistCommands, TestNamesTheEntryThatDecides) {
  putWhitelist(dict("A", dict("ScalarKeyPrefixes", dict("n.", integer("sig_fig", "1"))) +
                             dict("DistributionKeys", dict("n.d", intervals({"1", "2"})))) +
               dict("B", dict("ScalarKeys", dict("n.x", ""))) +
               dict("InternalTesting", dict("ScalarKeys", dict("secret", ""))));
  const struct {
    const char* key;
    bool scalar, distribution;
    const char* group;   // of the scalar
    const char* reason;  // of the scalar
    std::size_t others;
  } cases[] = {
      {"n.x", true, false, "B", "the group B lists it", 1},
      {"n.y", true, false, "A", "the group A lists the prefix n.", 0},
      {"n.d", true, true, "A", "the group A lists the prefix n.", 0},
      {"N.x", false, false, nullptr, "it is not listed", 0},
      {"secret", false, false, nullptr,
       "named only by the group InternalTesting, which is for internal devices only", 1},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.key);
    const Outcome outcome = run({"whitelist", "test", c.key, "--json"});
    const auto verdict = outcome.json()[0];
    EXPECT_EQ(verdict["scalar"]["reported"], c.scalar);
    EXPECT_EQ(verdict["distribution"]["reported"], c.distribution);
    EXPECT_EQ(verdict["scalar"]["reason"], c.reason);
    EXPECT_EQ(verdict["scalar"].value("group", ""), c.group != nullptr ? c.group : "");
    EXPECT_EQ(verdict["scalar"]["otherEntries"].size(), c.others);
    EXPECT_EQ(outcome.status, c.scalar || c.distribution ? kSuccess : kWrong);
  }
  EXPECT_EQ(run({"whitelist", "test", "n.x", "N.x"}).status, kWrong);
}

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
        "absent as a scalar: the store has no such row"}},
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
