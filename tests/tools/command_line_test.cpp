// The command line as a whole: what is refused and how, the form of failures, completion.
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::Not;

class CommandLine : public ToolTest {
 protected:
  // The first words of the lines that complete what the last word begins.
  std::vector<std::string> completed(const std::vector<std::string>& words) {
    std::vector<std::string> lines = split(runUnder({"complete", "--"}, words).out, '\n');
    for (std::string& line : lines) line = line.substr(0, line.find('\t'));
    return lines;
  }
};

TEST_F(CommandLine, WhatIsRefusedIsNamedWithWhatMayBeMeant) {
  const struct {
    std::vector<std::string> arguments;
    const char* says;
  } cases[] = {
      {{}, "tallyctl needs a command: store, record, recorder, whitelist"},
      {{"stroe", "keys"}, "has no command \"stroe\"; did you mean store?"},
      {{"store"}, "tallyctl store needs a command: set, push, import, dump or keys"},
      {{"store", "\x1b[31m"}, "has no command \"\\x1b[31m\", only set, push"},
      {{"store", "keys", "--jsn"}, "tallyctl store keys has no option --jsn; did you mean --json?"},
      {{"store", "dump", "--day"}, "--day needs a value"},
      {{"nand", "info", "--root", "a", "--root", "b"}, "--root is given more than once"},
      {{"store", "keys", "more"}, "\"more\" is one argument too many"},
      {{"store", "set", "k\x1b[31m", "x\x07"}, "the value is not"},
      {{"prefs", "set", "k\x01", "1"}, "k\\x01 cannot be stored as given"},
      {{"prefs", "set", "k", "\xff"}, "cannot be stored as given"},
  };
  for (const auto& c : cases) {
    const Outcome outcome = run(c.arguments);
    EXPECT_EQ(outcome.status, kBadUsage) << c.says;
    EXPECT_THAT(outcome.err, HasSubstr(c.says));
    EXPECT_THAT(outcome.err, Not(HasSubstr("\x1b")));
    EXPECT_EQ(outcome.out, "") << c.says;
    const auto error = nlohmann::json::parse(runUnder({"--json"}, c.arguments).err)["error"];
    EXPECT_EQ(error["status"], kBadUsage) << c.says;
  }
}

TEST_F(CommandLine, EveryFailureUnderJsonIsOneObject) {
  put("rows.csv", "bad\n");
  const std::string lines =
      "report show 9|report preview|explain no.such|nand info|nand defects|channels list|prefs get "
      "x|whitelist check|whitelist test a|doctor|store import " +
      at("rows.csv") + "|tasking apply " + at("none");
  for (const std::string& line : split(lines, '|')) {
    SCOPED_TRACE(line);
    std::vector<std::string> asJson = split(line, ' ');
    asJson.insert(asJson.begin() + 1, "--json");
    const Outcome outcome = run(asJson);
    EXPECT_EQ(outcome.status, kWrong);
    const std::size_t last = outcome.err.rfind('\n', outcome.err.size() - 2) + 1;
    const auto error = nlohmann::json::parse(outcome.err.substr(last))["error"];
    EXPECT_EQ(error["status"], kWrong);
    EXPECT_NE(error["message"], "");
    EXPECT_TRUE(outcome.out.empty() || !outcome.json().contains("error"));
    EXPECT_EQ(run(split(line, ' ')).status, kWrong);
  }
}

TEST_F(CommandLine, CompletionKnowsWhatTheDeviceHolds) {
  putRows(
      "scalar,bus10,20000,,1\nscalar,bus2,19999,,1\ndistribution,d,20000,1,1\n"
      "scalar,odd\x1bkey,20000,,1\n");
  putList(kPreferences + "vellum.da.plist", R"({"G": true})");
  EXPECT_THAT(completed({"sto"}), ElementsAre("store"));
  EXPECT_THAT(completed({"store", ""}), ElementsAre("set", "push", "import", "dump", "keys"));
  EXPECT_THAT(completed({"record", "time", "b", "--", "--r"}), ElementsAre(":file"));
  EXPECT_THAT(completed({"record", "time", "b", "ls", "--r"}), ElementsAre(":file"));
  EXPECT_THAT(completed({"explain", "b"}), ElementsAre("bus2", "bus10"));
  EXPECT_THAT(completed({"whitelist", "test", "x", "d"}), ElementsAre("d"));
  EXPECT_THAT(completed({"store", "dump", "--day", "20"}), ElementsAre("2024-10-04", "2024-10-03"));
  EXPECT_THAT(completed({"store", "dump", "--day=y"}), ElementsAre("--day=yesterday"));
  EXPECT_THAT(completed({"store", "keys", "--j"}), ElementsAre("--json"));
  EXPECT_THAT(completed({"store", "keys", "--root", ""}), ElementsAre(":dir"));
  EXPECT_THAT(completed({"prefs", "list", "--domain", ""}), ElementsAre("vellum.da"));
  EXPECT_THAT(completed({"prefs", "get", "--domain", "vellum.da", ""}), ElementsAre("G"));
  EXPECT_THAT(completed({"prefs", "set", "--type", "b"}), ElementsAre("boolean"));
  EXPECT_THAT(completed({"report", "show", ""}), ElementsAre(":file"));
  EXPECT_THAT(completed({"store", "set", "bus2", "1", ""}), ElementsAre());
  EXPECT_THAT(completed({"complete"}), ElementsAre());
}

}  // namespace
}  // namespace tally::tools
