// tallyctl prefs and doctor: typed values in and out, and what is found wrong.
#include <ctime>

#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

const std::string kOwnDomain = kPreferences + "vellum.tallyd.tallyrun.plist";

using PrefsCommands = ToolTest;

TEST_F(PrefsCommands, ValuesKeepTheirTypes) {
  putList("list.plist", R"([{"n": "<data>AP8=</data>"}])");
  const struct {
    std::vector<std::string> value;
    const char *values, *stored;
  } cases[] = {
      {{"true"}, R"({"/type": "boolean", "/value": true})", "<true/>"},
      {{"-12"}, R"({"/type": "integer", "/value": -12})", "<integer>-12</integer>"},
      {{"9223372036854775808"}, R"({"/type": "real", "/value": 9223372036854775808})", "<real>"},
      {{"12 apples"}, R"({"/type": "string"})", "<string>12 apples</string>"},
      {{"12", "--type", "string"}, R"({"/value": "12"})", "<string>12</string>"},
      {{"--file", at("list.plist")}, R"({"/type": "array", "/value": [{"n": "AP8="}]})", "<data>"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.stored);
    EXPECT_EQ(runUnder({"prefs", "set", "k"}, c.value).status, kSuccess);
    expectValues(run({"prefs", "get", "k", "--json"}).json(), c.values);
    EXPECT_THAT(get(kOwnDomain), HasSubstr(c.stored));
  }
}

TEST_F(PrefsCommands, MissingKeysBadValuesAndNames) {
  put("broken.plist", "<plist>");
  EXPECT_EQ(run({"prefs", "set", "a", "1", "--domain", "x.y"}).status, kSuccess);
  const struct {
    std::vector<std::string> arguments;
    int status;
  } cases[] = {
      {{"get", "b", "--domain", "x.y"}, kWrong},
      {{"get", "a", "--domain", "x.y"}, kSuccess},
      {{"delete", "b", "--domain", "x.y"}, kWrong},
      {{"set", "a", "1.5", "--type", "integer"}, kBadUsage},
      {{"set", "a", "1", "--type", "boolean"}, kBadUsage},
      {{"set", "a"}, kBadUsage},
      {{"set", "a", "1", "--file", at("broken.plist")}, kBadUsage},
      {{"set", "a", "--file", at("broken.plist")}, kBadUsage},
      {{"set", "a", "1", "--domain", "../x"}, kBadUsage},
      {{"list", "--domain", "none"}, kWrong},
      {{"delete", "a", "--domain", "x.y"}, kSuccess},
      {{"get", "a", "--domain", "x.y"}, kWrong},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(runUnder({"prefs"}, c.arguments).status, c.status)
        << testing::PrintToString(c.arguments);
  }
  EXPECT_EQ(names(kPreferences), std::vector<std::string>{"x.y.plist"});
}

class DoctorCommand : public ToolTest {
 protected:
  // "health subject: text" for each line about the subject.
  std::vector<std::string> linesAbout(const std::string& subject) {
    const Outcome outcome = run({"doctor", "--json"});
    std::vector<std::string> lines;
    bool wrong = false;
    const auto document = outcome.json();
    for (const auto& line : document) {
      wrong = wrong || line["health"] == "wrong";
      if (line["subject"] != subject) continue;
      lines.push_back(line["health"].get<std::string>() + ": " + line["text"].get<std::string>());
    }
    EXPECT_EQ(outcome.status, wrong ? kWrong : kSuccess);
    return lines;
  }
};

TEST_F(DoctorCommand, FindsWhatIsMissingAndWhatIsWrong) {
  const std::string today = std::to_string(std::time(nullptr) / 86400), rows = "rows.csv";
  const auto lastDay = [](const std::string& day) {
    return R"({"LastCrashLogSerializationDateInDaysSince1970": )" + day + "}";
  };
  const struct {
    const char* subject;
    std::string path, content;  // of the file that is written first: JSON is made a property list
    const char* lines;          // about it: how each begins, separated by |
  } cases[] = {
      {"device root", "", "", "wrong: "},
      {"device root", "device/file", "", "ok: "},
      {"whitelist", kWhitelist, R"({"G": true})", "wrong: 1 fault"},
      {"whitelist", kWhitelist, R"({"G": {"ScalarKeys": {"a": {}}}})", "ok: 0"},
      {"whitelist", kPreferences + "vellum.da.plist", R"({"G": false})",
       "ok: 0 faults, 1 surprise|missing: the group G is disabled by tasking"},
      {"metrics store", rows, "scalar,a," + today + ",,1\ndistribution,d,20000,1,1\n",
       "ok: 1 scalar, 1 distribution, up to "},
      {"metrics store", rows, "scalar,a,999999,,1\n", "ok: |wrong: it has days"},
      {"metrics store", kStore, "no database at all", "wrong: "},
      {"preferences", kOwnDomain, "damaged", "wrong: preferences vellum.tallyd.tallyrun"},
      {"preferences", kOwnDomain, "{}", "ok: 2 domains"},
      {"preferences", kOwnDomain + ".damaged-1", "x",
       "ok: 2 domains|wrong: 1 damaged file set aside"},
      {"flash storage", "", "", "missing: no driver"},
      {"statistics", "", "", "missing: 0 channels, no hub"},
      {"flash storage", kRegistry,
       R"({"Entries": [{"Class": "SPXStorage"}, {"Class": "HwReportHub"}]})",
       "wrong: driver SPXStorage cannot be opened: error 0xe00002c7"},
      {"last day", "", "", "missing: "},
      {"last day", kOwnDomain, lastDay("20000"), "missing: day 20000 (2024-10-04) was processed"},
      {"last day", kOwnDomain, lastDay("999999"), "wrong: "},
      {"device description", kDescription,
       R"({"RegionCode": true, "Kernelvalues": {}, "Notes": "x", "SystemID": 1,
           "AnalyticsEvents": {"Wanted": "x", "Absnt": true}})",
       "ok: 5 entries|wrong: RegionCode is a boolean, not a string, and is ignored|"
       "wrong: Kernelvalues is not known; KernelValues may be meant|"
       "wrong: SystemID is a number, not a string|"
       "wrong: AnalyticsEvents.Wanted is a string, not an array|"
       "wrong: AnalyticsEvents.Absnt is not known; AnalyticsEvents.Absent may be meant"},
      {"crash support", kDescription, R"({"CrashSupport": {"Absent": true}})",
       "missing: the library is missing"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.subject) + " " + c.lines);
    if (c.path == rows) putRows(c.content);
    if (c.content.starts_with('{')) putList(c.path, c.content);
    if (!c.path.empty() && !c.content.starts_with('{')) put(c.path, c.content);
    EXPECT_THAT(linesAbout(c.subject), testing::Pointwise(Begins(), split(c.lines, '|')));
  }
}

}  // namespace
}  // namespace tally::tools
