// tallyctl prefs and doctor: typed values in and out, and what is found wrong.
#include <ctime>

#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;

constexpr const char* kFolder = "device/var/mobile/Library/Preferences/";

using PrefsCommands = ToolTest;

TEST_F(PrefsCommands, ValuesKeepTheirTypes) {
  put("list.plist",
      "<plist version=\"1.0\"><array><dict><key>n</key><data>AP8=</data></dict></array></plist>");
  const struct {
    std::vector<std::string> value;
    const char* type;
    nlohmann::json read;
    const char* stored;
  } cases[] = {
      {{"true"}, "boolean", true, "<true/>"},
      {{"-12"}, "integer", -12, "<integer>-12</integer>"},
      {{"9223372036854775808"}, "real", 9223372036854775808.0, "<real>"},
      {{"12 apples"}, "string", "12 apples", "<string>12 apples</string>"},
      {{"12", "--type", "string"}, "string", "12", "<string>12</string>"},
      {{"--file", at("list.plist")}, "array", {{{"n", "AP8="}}}, "<data>"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.stored);
    EXPECT_EQ(runUnder({"prefs", "set", "k"}, c.value).status, kSuccess);
    const auto json = run({"prefs", "get", "k", "--json"}).json();
    EXPECT_EQ(json["type"], c.type);
    EXPECT_EQ(json["value"], c.read);
    EXPECT_THAT(get(kFolder + std::string("vellum.tallyd.tallyrun.plist")), HasSubstr(c.stored));
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
  EXPECT_EQ(names(kFolder), std::vector<std::string>{"x.y.plist"});
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
  const std::string domain = kFolder + std::string("vellum.tallyd.tallyrun.plist");
  const std::string today = std::to_string(std::time(nullptr) / 86400);
  const auto setLastDay = [&](const char* day) {
    putPlist(domain,
             "<dict>" + integer("LastCrashLogSerializationDateInDaysSince1970", day) + "</dict>");
  };
  const struct {
    const char* subject;
    std::function<void()> prepare;
    std::vector<const char*> parts;  // of each line about it
  } cases[] = {
      {"device root", [] {}, {"wrong: "}},
      {"device root", [&] { std::filesystem::create_directories(at("device")); }, {"ok: "}},
      {"whitelist", [&] { putWhitelist("<key>G</key><true/>"); }, {"wrong: 1 fault"}},
      {"whitelist", [&] { putWhitelist(dict("G", dict("ScalarKeys", dict("a", "")))); }, {"ok: 0"}},
      {"whitelist",
       [&] {
         putPlist(kFolder + std::string("vellum.da.plist"), "<dict><key>G</key><false/></dict>");
       },
       {"ok: 0 faults, 1 surprise", "missing: the group G is disabled by tasking"}},
      {"metrics store",
       [&] { putRows("scalar,a," + today + ",,1\ndistribution,d,20000,1,1\n"); },
       {"ok: 1 scalar, 1 distribution, up to "}},
      {"metrics store", [&] { putRows("scalar,a,999999,,1\n"); }, {"ok: ", "wrong: it has days"}},
      {"metrics store",
       [&] {
         put("device/var/mobile/Library/Tallybook/TBDataStore.sqlitedb", "no database at all");
       },
       {"wrong: "}},
      {"preferences",
       [&] { put(domain, "damaged"); },
       {"wrong: preferences vellum.tallyd.tallyrun"}},
      {"preferences",
       [&] {
         putPlist(domain, "<dict/>");
         put(domain + ".damaged-1", "x");
       },
       {"ok: 2 domains", "wrong: 1 damaged file set aside"}},
      {"flash storage", [] {}, {"missing: no driver"}},
      {"statistics", [] {}, {"missing: 0 channels, no hub"}},
      {"flash storage",
       [&] {
         putPlist(
             "device/device/registry.plist",
             "<dict><key>Entries</key><array><dict><key>Class</key><string>SPXStorage</string>"
             "</dict><dict><key>Class</key><string>HwReportHub</string></dict></array></dict>");
       },
       {"wrong: driver SPXStorage cannot be opened: error 0xe00002c7"}},
      {"last day", [] {}, {"missing: "}},
      {"last day", [&] { setLastDay("20000"); }, {"missing: day 20000 (2024-10-04) was processed"}},
      {"last day", [&] { setLastDay("999999"); }, {"wrong: "}},
      {"device description",
       [&] {
         putPlist("device/device/device.plist",
                  "<dict><key>RegionCode</key><true/><key>Kernelvalues</key><dict/>"
                  "<key>Notes</key><string>x</string><key>SystemID</key><integer>1</integer>"
                  "<key>AnalyticsEvents</key><dict><key>Wanted</key><string>x</string>"
                  "<key>Absnt</key><true/></dict></dict>");
       },
       {"ok: 5 entries", "wrong: RegionCode is a boolean, not a string, and is ignored",
        "wrong: Kernelvalues is not known; KernelValues may be meant",
        "wrong: SystemID is a number, not a string",
        "wrong: AnalyticsEvents.Wanted is a string, not an array",
        "wrong: AnalyticsEvents.Absnt is not known; AnalyticsEvents.Absent may be meant"}},
      {"crash support",
       [&] {
         putPlist("device/device/device.plist",
                  "<dict>" + dict("CrashSupport", "<key>Absent</key><true/>") + "</dict>");
       },
       {"missing: the library is missing"}},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(std::string(c.subject) + " " + testing::PrintToString(c.parts));
    c.prepare();
    std::vector<testing::Matcher<std::string>> wanted;
    for (const char* part : c.parts) wanted.push_back(testing::StartsWith(part));
    EXPECT_THAT(linesAbout(c.subject), testing::ElementsAreArray(wanted));
  }
}

}  // namespace
}  // namespace tally::tools
