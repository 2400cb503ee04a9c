// tallyctl whitelist and explain: what is found in a file, and what is said of a key.
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

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

TEST_F(WhitelistCommands, CheckFindsFaultsAndSurprises) {
  const std::string longKey(513, 'k');
  const struct {
    std::string groups;
    std::vector<std::string> found;  // the beginning of each finding
  } cases[] = {
      {R"({"G": {"ScalarKeys": {"k": {"sig_fig": 2}}}})", {}},
      {R"({"G": []})", {"fault /G: not a dictionary"}},
      {R"({"G": {"ScalarKey": {"a": {}}, "ScalarKeys": true}})",
       {"fault /G/ScalarKey: no section", "fault /G/ScalarKeys: not a dictionary"}},
      {R"({"G": {"ScalarKeys": {"a": {"sig_fig": -1}, "b": {"sigfigs": 2},
           "c": {"bucket_interval": 0}, "d": {"sig_fig": 0}, "e": {"sig_fig": 19},
           "f": {"sig_fig": 2, "bucket_interval": 5}, "g": {"intervals": [1]}}}})",
       {"fault /G/ScalarKeys/a/sig_fig: not a whole number",
        "fault /G/ScalarKeys/b/sigfigs: no option", "fault /G/ScalarKeys/c/bucket_interval: a step",
        "surprise /G/ScalarKeys/d/sig_fig: no figure",
        "surprise /G/ScalarKeys/e/sig_fig: no value has more", "surprise /G/ScalarKeys/f: has both",
        "surprise /G/ScalarKeys/g/intervals: scalars have"}},
      {R"({"G": {"DistributionKeys": {"a": {"sig_fig": 2}, "b": {"intervals": [1, 3, 2.0, 3, 4]},
           "c": {"intervals": [1, "<real>nan</real>", 2]}, "d": {"intervals": []}}}})",
       {"surprise /G/DistributionKeys/a/sig_fig: distributions are not",
        "fault /G/DistributionKeys/b/intervals: boundary 3, 2, is below",
        "fault /G/DistributionKeys/b/intervals: boundary 4, 3, is there twice",
        "fault /G/DistributionKeys/c/intervals: boundary 2 is not a number",
        "surprise /G/DistributionKeys/d/intervals: no boundary"}},
      // Entries beside each other.
      {R"({"A": {"ScalarKeys": {"k": {"sig_fig": 2}}}, "G": {"ScalarKeys": {"k": {}}}})",
       {"surprise /G/ScalarKeys/k: the group A lists it too, with sig_fig 2; the later"}},
      {R"({"G": {"ScalarKeyPrefixes": {"n.": {}, "n.w.": {}}, "ScalarKeys": {"n.": {}}}})",
       {"surprise /G/ScalarKeys/n.: the group G has a prefix of the same text",
        "surprise /G/ScalarKeyPrefixes/n.w.: says the same as the prefix n."}},
      {R"({"G": {"ScalarKeyPrefixes": {"n.": {"sig_fig": 1}}, "ScalarKeys": {"n.x": {}}}})",
       {"surprise /G/ScalarKeys/n.x: reported without options, though"}},
      {R"({"G": {"DistributionKeyPrefixes": {"": {}}, "ScalarKeys": {"": {}, ")" + longKey +
           R"(": {}}}})",
       {"surprise /G/DistributionKeyPrefixes: the empty prefix admits every distribution",
        "fault /G/ScalarKeys: no key of the store can match",
        "fault /G/ScalarKeys/" + longKey + ": no key"}},
      // Groups.
      {R"({"G": {}, "InternalTesting": {"ScalarKeyPrefixes": {"": {}}},
           "Off": {"ScalarKeys": {"k": {}}}, "Odd": {"ScalarKeys": {"l": {}}}})",
       {"surprise /G: the group admits no key",
        "surprise /InternalTesting: not in force here: it is for internal devices only",
        "surprise /InternalTesting/ScalarKeyPrefixes: the empty prefix",
        "surprise /Off: not in force here: it is disabled by tasking",
        "surprise /Odd: its switch in the preferences vellum.da is not a boolean"}},
  };
  putList(kPreferences + "vellum.da.plist", R"({"Off": false, "Odd": "no"})");
  for (const auto& c : cases) {
    SCOPED_TRACE(c.groups.substr(0, 200));
    putWhitelist(c.groups);
    EXPECT_THAT(findings(), testing::Pointwise(Begins(), c.found));
  }
}

TEST_F(WhitelistCommands, AFileThatCannotBeUsedIsAFault) {
  EXPECT_THAT(findings(), testing::ElementsAre(HasSubstr("No such file")));
  putWhitelist(R"("<key>")");
  EXPECT_THAT(findings(), testing::ElementsAre(HasSubstr("the file cannot be used")));
  putWhitelist(R"({"G": {"ScalarKeys": {"k": {}}}})");
  EXPECT_EQ(run({"whitelist", "check", at("nowhere")}).status, kWrong);
}

TEST_F(WhitelistCommands, TestNamesTheEntryThatDecides) {
  putWhitelist(R"({"A": {"ScalarKeyPrefixes": {"n.": {"sig_fig": 1}},
                          "DistributionKeys": {"n.d": {"intervals": [1, 2]}}},
                    "B": {"ScalarKeys": {"n.x": {}}},
                    "InternalTesting": {"ScalarKeys": {"secret": {}}}})");
  const struct {
    const char* key;
    int status;
    const char* values;
  } cases[] = {
      {"n.x", kSuccess,
       R"({"/scalar/reported": true, "/distribution/reported": false, "/scalar/group": "B",
           "/scalar/reason": "the group B lists it", "/scalar/otherEntries/0/group": "A"})"},
      {"n.y", kSuccess,
       R"({"/scalar/reported": true, "/distribution/reported": false, "/scalar/group": "A",
           "/scalar/reason": "the group A lists the prefix n.", "/scalar/otherEntries": []})"},
      {"n.d", kSuccess, R"({"/scalar/group": "A", "/distribution/reported": true,
           "/scalar/otherEntries": []})"},
      {"N.x", kWrong,
       R"({"/scalar/reported": false, "/distribution/reported": false, "/scalar/group":
           "absent", "/scalar/reason": "it is not listed", "/scalar/otherEntries": []})"},
      {"secret", kWrong, R"({"/scalar/reported": false, "/scalar/group": "absent",
           "/scalar/otherEntries/0/group": "InternalTesting", "/scalar/reason":
           "named only by the group InternalTesting, which is for internal devices only"})"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.key);
    const Outcome outcome = run({"whitelist", "test", c.key, "--json"});
    expectValues(outcome.json()[0], c.values);
    EXPECT_EQ(outcome.status, c.status);
  }
  EXPECT_EQ(run({"whitelist", "test", "n.x", "N.x"}).status, kWrong);
}

class ExplainCommand : public ToolTest {
 protected:
  void SetUp() override {
    putList(kDescription, R"({"KernelValues": {"kern.memorystatus_thaw_count": 31,
        "kern.memorystatus_freezer_process_considered_count": 0,
        "kern.memorystatus_freezer_error_other_count": 2}})");
    putWhitelist(R"({"G": {"ScalarKeys": {"a": {"bucket_interval": 10, "sig_fig": 2}, "empty": {},
                         "vellum.kernel.memorystatus_thaw_count": {},
                         "vellum.memorystatus_freezer_error_other_count": {}},
                         "DistributionKeys": {"d": {"intervals": [2]}}},
                   "Off": {"ScalarKeyPrefixes": {"off.": {}}},
                   "InternalTesting": {"ScalarKeys": {"secret": {}}}})");
    putList(kPreferences + "vellum.da.plist", R"({"Off": false})");
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
    const char* parts;  // of the text, separated by |
    const char* day = "20000";
  } cases[] = {
      {"a", kSuccess,
       "2024-10-03       7\n|2024-10-04   1,236\n|bucket_interval 10: 1,236 becomes 1,240|sig_fig "
       "2: 1,240 becomes 1,200|made now\n  scalar 1,200\n|no log of that day was submitted"},
      {"d", kSuccess,
       "admitted  as a distribution: the group G lists it|options: intervals of 1 "
       "number|distribution of 2 samples: min 1, mean 2, std dev 1, max 3|(-inf, 2]|(2, "
       "inf)|absent as a scalar: the store has no such row"},
      {"ab", kWrong, "refused  as a scalar: it is not listed|whitelist refuses it"},
      {"secret", kWrong, "InternalTesting, which is for internal devices only"},
      {"empty", kWrong, "no rows of this key|the store has no such row on that day"},
      {"vellum.kernel.memorystatus_thaw_count", kSuccess,
       "the report measures this key itself|measured now  31|scalar 31"},
      {"vellum.kernel.memorystatus_thaw_count", kWrong, "no log is made and nothing is measured",
       "20002"},
      {"vellum.memorystatus_freezer_error_other_count", kWrong,
       "it cannot be measured: a count that it needs cannot be read, or is 0"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.key) + " on " + c.day);
    const Outcome outcome = run({"explain", c.key, "--day", c.day});
    EXPECT_EQ(outcome.status, c.status);
    expectParts(outcome.out, split(c.parts, '|'));
  }
}

TEST_F(ExplainCommand, ComparesWithWhatWasSubmitted) {
  submit(20000);
  submit(20003);
  EXPECT_THAT(run({"explain", "d", "--day", "20000"}).out, HasSubstr("the same distribution"));
  putWhitelist(R"({"G": {"ScalarKeys": {"b": {}}}})");
  const Outcome outcome = run({"explain", "a", "--day", "20000"});
  EXPECT_EQ(outcome.status, kWrong);
  expectParts(outcome.out, {"0000000001-log-tallyd.log\n  scalar 1,200\n",
                            "it was made with another whitelist"});
  expectValues(run({"explain", "a", "--day", "20000", "--json"}).json(),
               R"({"/submittedLog/scalar": 1200, "/nextLog": null, "/scalarRows/1/value": 1236,
                   "/whyAbsent/scalar": "the whitelist refuses it: it is not listed",
                   "/absence/scalar": "absent"})");
}

}  // namespace
}  // namespace tally::tools
