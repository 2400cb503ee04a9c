// tallyctl whitelist: what is found in a file, and what is said of a key.
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
       {"surprise /InternalTesting: does not count here: it is for internal devices only",
        "surprise /InternalTesting/ScalarKeyPrefixes: the empty prefix"}},
      {dict("Off", dict("ScalarKeys", dict("k", ""))),
       {"surprise /Off: does not count here: it is disabled by tasking"}},
      {dict("Odd", dict("ScalarKeys", dict("k", ""))),
       {"surprise /Odd: its switch in the preferences vellum.da is no boolean"}},
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

TEST_F(WhitelistCommands, ControlsOfAFileNeverReachTheTerminal) {
  // A property list in XML cannot carry most of them, but U+009B and U+202E are characters to it.
  putWhitelist(
      dict("a\xc2\x9b"
           "31m\xe2\x80\xae",
           ""));
  const Outcome outcome = run({"whitelist", "check"});
  EXPECT_THAT(outcome.out, HasSubstr("a\\x9b31m\\u202e"));
  EXPECT_EQ(outcome.out.find("\xc2\x9b"), std::string::npos);
  EXPECT_THAT(run({"whitelist", "test", "\x1b]0;x\x07"}).out, HasSubstr("\\x1b]0;x\\x07"));
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

}  // namespace
}  // namespace tally::tools
