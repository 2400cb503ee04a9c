// tallyctl tasking and send, as far as no bus is needed.
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

Json tasking(const std::string& id, const std::vector<Json>& entries) {
  auto payload = Json::array();
  for (const Json& one : entries) {
    payload.push_back({{"User", one[0]}, {"Domain", one[1]}, {"Key", one[2]}, {"Value", "v"}});
  }
  return {{"TaskingID", id}, {"TaskingDigest", "d"}, {"TaskingPayload", payload}};
}

class TaskingCommandsTest : public ToolTest {
 protected:
  TaskingCommandsTest() {
    putList(kDescription, R"({"SystemVersion": {"ProductBuildVersion": "16S46"}})");
  }
  // "set USER DOMAIN KEY" of each planned write, without the program's own record.
  static std::vector<std::string> writes(const nlohmann::json& plan) {
    std::vector<std::string> found;
    for (const auto& one : plan["writes"]) {
      const auto text = [&](const char* name) { return one[name].get<std::string>(); };
      if (text("domain") == "vellum.tallyd.tallyrun") continue;
      found.push_back(text("action") + " " + text("user") + " " + text("domain") + " " +
                      text("key"));
    }
    return found;
  }
};

TEST_F(TaskingCommandsTest, ADryRunPrintsWhatAnApplicationDoes) {
  putPlist("a.plist", element(tasking("A", {{"mobile", "vellum.da", "G"},
                                            {"__sysmetra__", "sys", "S"},
                                            {"guest", "dom", "K"}})));
  const auto before = tree();
  const auto dry = run({"tasking", "apply", at("a.plist"), "--dry-run", "--json"});
  EXPECT_EQ(dry.status, kSuccess) << dry.err;
  EXPECT_EQ(tree(), before) << "a dry run leaves no trace";
  EXPECT_THAT(writes(dry.json()),
              ElementsAre("set mobile vellum.da G", "set __sysmetra__ sys S", "set guest dom K"));

  EXPECT_EQ(run({"tasking", "apply", at("a.plist")}).status, kSuccess);
  EXPECT_THAT(get(kPreferences + "vellum.da.plist"), HasSubstr("G"));
  EXPECT_THAT(get("device/Library/Preferences/sys.plist"), HasSubstr("S"));
  EXPECT_THAT(get("device/var/guest/Library/Preferences/dom.plist"), HasSubstr("K"));

  putPlist("device/Library/Preferences/vellum.Ferryman.plist",
           element({{"ScheduledTasking", tasking("B", {{"mobile", "vellum.da", "H"}})}}));
  const auto shown = run({"tasking", "show", "--json"}).json();
  expectValues(shown, R"({"/inForce/id": "A", "/inForce/system": "16S46", "/scheduled/id": "B",
                          "/unfinished": false})");
  EXPECT_THAT(writes(shown["change"]),
              ElementsAre("remove mobile vellum.da G", "remove __sysmetra__ sys S",
                          "remove guest dom K", "set mobile vellum.da H"));
  EXPECT_THAT(run({"tasking", "show"}).out, HasSubstr("Tasking update (A -> B, 16S46 -> 16S46)"));
}

TEST_F(TaskingCommandsTest, BadTaskingsAreNamed) {
  putPlist("fault.plist", element(tasking("F", {{"../../etc", "dom", "K"}})));
  const auto fault = run({"tasking", "apply", at("fault.plist"), "--dry-run"});
  EXPECT_EQ(fault.status, kWrong);
  EXPECT_THAT(fault.out, HasSubstr("its \"User\" cannot be a file's name: ../../etc"));
  put("text", "no property list");
  putPlist("unnamed", "<dict><key>TaskingPayload</key><array/></dict>");
  for (const char* name : {"text", "absent", "unnamed"}) {
    const auto outcome = run({"tasking", "apply", at(name), "--dry-run"});
    EXPECT_EQ(outcome.status, kWrong);
    EXPECT_THAT(outcome.err, HasSubstr(at(name)));
  }
}

TEST_F(TaskingCommandsTest, ApplicationListsAreCheckedBeforeTheyAreSent) {
  const std::string good = R"({"bundle_id":"a","version":"1","adam_id":1,"arch":1,)"
                           R"("uuid":"00112233-4455-6677-8899-aabbccddeeff"})";
  const struct {
    std::string content, fault;
  } cases[] = {
      {"", "neither JSON nor a property list"},
      {"[" + good + ",{}]", "element 1: no text \"bundle_id\""},
      {R"([{"bundle_id":"a","version":"1","adam_id":1.5}])", "element 0: no integer \"adam_id\""},
      {R"([{"bundle_id":"a","version":"1","adam_id":9223372036854775808}])",
       "element 0: \"adam_id\" does not fit"},
      {"[" + std::string(good).replace(good.find("33-"), 3, "33x") + "]", "no \"uuid\""},
  };
  for (const auto& c : cases) {
    put("list", c.content);
    const auto outcome = run({"send", "apps", at("list")});
    EXPECT_EQ(outcome.status, kWrong) << c.content;
    EXPECT_THAT(outcome.err, HasSubstr(c.fault)) << c.content;
  }
  EXPECT_EQ(run({"send", "day", "soon"}).status, kBadUsage);
}

}  // namespace
}  // namespace tally::tools
