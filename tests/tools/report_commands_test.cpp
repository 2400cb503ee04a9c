// tallyctl report: a preview is the log that follows, and leaves no trace.
#include "kv/plist_codec.h"
#include "report/daily_report.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;
using testing::Not;

constexpr const char* kSpool = "device/var/mobile/Library/Logs/Submission/";

class ReportCommands : public ToolTest {
 protected:
  void SetUp() override {
    putPlist("device/device/device.plist", "<dict>" + integer("MonotonicTicks", "7200000000000") +
                                               "<key>RegionCode</key><string>CH</string></dict>");
    putWhitelist(
        dict("G", dict("ScalarKeys", dict("a", integer("sig_fig", "1")) + dict("b", "") +
                                         dict("vellum.usage.cur_boot_session_cpu_uptime", "") +
                                         dict("vellum.sysmetra.tlyd.database.corruptions", "")) +
                      dict("DistributionKeys", dict("d", intervals({"2", "5"})))));
    putPlist("device/var/mobile/Library/Preferences/vellum.tallyd.plist",
             "<dict>" + integer("DatabaseCorruptionCount", "3") + "</dict>");
    putRows(
        "scalar,a,20000,,17\nscalar,b,20000,,5\nscalar,secret,20000,,9\n"
        "distribution,d,20000,1,2\ndistribution,d,20000,2,4\ndistribution,d,20000,3,4\n"
        "distribution,d,20000,4,4\ndistribution,d,20000,5,5\ndistribution,d,20000,6,5\n"
        "distribution,d,20000,7,7\ndistribution,d,20000,8,9\n");
  }
  // What the daily job would do for the day.
  void submit(std::int32_t day) {
    const PlatformScope scope(makeLinuxPlatform(at("device"), {log, false}));
    writeDailyLog(platform(), day, nullptr);
  }
  std::string body(int number) {
    return get(kSpool + fmt::format("{:010}-log-tallyd.log", number));
  }
};

// A document without the moment of its making.
nlohmann::json timeless(nlohmann::json document) {
  document.erase("TBLogCreationDate");
  return document;
}

TEST_F(ReportCommands, APreviewIsTheNextLogAndLeavesNoTrace) {
  // A damaged domain is set aside by the daily job, and must stay where it is here.
  put("device/var/mobile/Library/Preferences/vellum.da.plist", "damaged");
  const auto before = tree();
  const Outcome text = run({"report", "preview", "--day", "20000"});
  const Outcome preview = run({"report", "preview", "--day", "2024-10-04", "--json"});
  const Outcome diff = run({"report", "preview", "--day", "20000", "--diff"});
  (void)run({"explain", "a", "--day", "20000"});
  (void)run({"doctor"});
  (void)run({"whitelist", "check"});
  (void)run({"prefs", "list", "--domain", "vellum.da"});
  EXPECT_EQ(tree(), before);
  EXPECT_EQ(text.status, kSuccess);
  EXPECT_EQ(diff.status, kSuccess);
  EXPECT_THAT(diff.out, HasSubstr("no log was submitted yet"));

  submit(20000);
  const auto document = preview.json()["document"];
  const auto shown = run({"report", "show", "--json"}).json();
  EXPECT_EQ(timeless(document), timeless(shown["document"]));
  EXPECT_EQ(preview.json()["options"], shown["options"]);
  EXPECT_EQ(document["TBScalars"],
            nlohmann::json({{"a", 20},
                            {"b", 5},
                            {"vellum.sysmetra.tlyd.database.corruptions", 3},
                            {"vellum.usage.cur_boot_session_cpu_uptime", 120}}));
  EXPECT_EQ(shown["standardDeviations"]["d"], 2.0);
  EXPECT_NE(tree(), before);  // so that the comparison above could have failed
}

TEST_F(ReportCommands, TheDayIsDrawnForPeople) {
  submit(20000);
  const std::string shown = run({"report", "show"}).out;
  for (const char* part :
       {"Daily log of day 20000 (2024-10-04)", "Scalars, 4 keys",
        "  a                                             20\n",
        "key  count  min  mean  std dev  max", "  d        8    2     5        2    9",
        "    (-inf, 2]  1  12.5 %  ███████▎\n",
        "       (2, 5]  5  62.5 %  ████████████████████████████"
        "████████\n",
        "     (5, inf)  2  25.0 %  ██████████████▍\n", "region               CH"}) {
    EXPECT_THAT(shown, HasSubstr(part));
  }
  EXPECT_THAT(shown, Not(HasSubstr("secret")));
  EXPECT_EQ(shown.find('\x1b'), std::string::npos);
  terminal.escapes = true;
  EXPECT_THAT(run({"report", "show"}).out, HasSubstr("\x1b[1mDaily log"));
}

TEST_F(ReportCommands, TheDiffNamesWhatChanged) {
  submit(20000);
  putRows(
      "scalar,b,20001,,8\ndistribution,d,20001,1,2\ndistribution,d,20001,1,9\n"
      "scalar,a,20002,,17\n");
  putPlist("device/device/device.plist",
           "<dict>" + integer("MonotonicTicks", "7200000000000") + "</dict>");
  const auto diff = run({"report", "preview", "--day", "20001", "--diff", "--json"}).json();
  EXPECT_EQ(diff["before"]["day"], 20000);
  EXPECT_EQ(diff["after"]["day"], 20001);
  EXPECT_EQ(diff["scalars"]["removed"], nlohmann::json({{"a", 20}}));
  EXPECT_EQ(diff["scalars"]["added"], nlohmann::json::object());
  EXPECT_EQ(diff["scalars"]["changed"],
            nlohmann::json({{"b", {{"before", 5}, {"after", 8}, {"delta", 3}}},
                            {"vellum.sysmetra.tlyd.database.corruptions",
                             {{"before", 3}, {"after", 0}, {"delta", -3}}}}));
  EXPECT_EQ(diff["distributions"]["changed"]["d"]["after"],
            nlohmann::json({2.0, 9.0, 5.5, 24.5, 2}));
  EXPECT_EQ(diff["histograms"]["changed"]["d"]["after"],
            nlohmann::json({{"(-inf, 2]", 1}, {"(5, inf)", 1}}));
  EXPECT_EQ(diff["metadata"]["removed"], nlohmann::json({{"TBUserSetRegionFormat", "CH"}}));
  const std::string text = run({"report", "preview", "--day", "20001", "--diff"}).out;
  for (const char* part :
       {"Scalars: 0 added, 1 removed, 2 changed", "+3\n", "(2, 5]       5\n", "TBStartDate"}) {
    EXPECT_THAT(text, HasSubstr(part));
  }
}

TEST_F(ReportCommands, WhatIsMissingOrDamagedIsSaid) {
  const struct {
    std::vector<std::string> arguments;
    int status;
    const char* message;
  } before[] = {
      {{"report", "show"}, kWrong, "no daily log was submitted yet"},
      {{"report", "show", "./nowhere.log"}, kWrong, "No such file"},
      {{"report", "preview", "--day", "20007"}, kWrong, "no log would be submitted"},
      {{"report", "preview", "--day", "2024-13-01"}, kBadUsage, "not a day"},
  };
  for (const auto& c : before) {
    const Outcome outcome = run(c.arguments);
    EXPECT_EQ(outcome.status, c.status) << c.message;
    EXPECT_THAT(outcome.err, HasSubstr(c.message));
    EXPECT_EQ(outcome.out, "") << c.message;
  }
  submit(20000);
  const std::string sound = body(1);
  const struct {
    std::string body;
    const char* message;
  } damaged[] = {
      {sound.substr(0, sound.size() / 2), "is damaged"},
      {"<plist version=\"1.0\"><dict/></plist>", "not a daily log"},
  };
  for (const auto& c : damaged) {
    put(kSpool + std::string("0000000001-log-tallyd.log"), c.body);
    for (const bool json : {false, true}) {
      const Outcome outcome = run(json ? std::vector<std::string>{"report", "show", "--json"}
                                       : std::vector<std::string>{"report", "show"});
      EXPECT_EQ(outcome.status, kWrong);
      EXPECT_THAT(outcome.err, HasSubstr(c.message));
    }
    const std::string fault = std::string(c.message).ends_with("log") ? c.message : "damaged";
    EXPECT_THAT(run({"report", "list"}).out, HasSubstr(fault));
    EXPECT_THAT(run({"doctor"}).out, HasSubstr("0000000001-log-tallyd.log is " + fault));
  }
  // Parts of the wrong type are shown as what they are.
  put(kSpool + std::string("0000000001-log-tallyd.log"),
      "<plist version=\"1.0\"><dict><key>TBCrashLogVersion</key><integer>1</integer>"
      "<key>TBDistributions</key><dict><key>d</key><array><true/></array></dict>"
      "<key>TBDistributionsHistogram</key><dict><key>d</key><string>x</string></dict>"
      "<key>TBScalars</key><array/></dict></plist>");
  const Outcome odd = run({"report", "show"});
  EXPECT_EQ(odd.status, kSuccess);
  EXPECT_THAT(odd.out, HasSubstr("an unknown day"));
  EXPECT_THAT(odd.out, HasSubstr("d    damaged"));
}

TEST_F(ReportCommands, LogsAreListedAndFound) {
  submit(20000);
  submit(20000);
  {
    const PlatformScope scope(makeLinuxPlatform(at("device"), {log, false}));
    platform().logSubmission->SMAWriteLogForSubmission(
        "165", "StorageStatus", nullptr, nullptr,
        [](LogFile& file) { file.write("worn: no\nname: \x1b[31m\n"); });
  }
  const auto list = run({"report", "list", "--json"}).json();
  ASSERT_EQ(list.size(), 3u);
  EXPECT_EQ(list[1]["day"], 20000);
  EXPECT_EQ(list[1]["keys"], 5);
  EXPECT_EQ(list[1]["bytes"], body(2).size());
  EXPECT_EQ(list[2]["day"], nullptr);
  const struct {
    std::string name;
    const char* found;
  } names[] = {
      {"", "0000000002-log-tallyd.log"},
      {"1", "0000000001-log-tallyd.log"},
      {"0000000003-StorageStatus.log", "0000000003-StorageStatus.log"},
  };
  for (const auto& c : names) {
    std::vector<std::string> arguments{"report", "show", "--json"};
    if (!c.name.empty()) arguments.push_back(c.name);
    EXPECT_EQ(run(arguments).json()["file"], c.found) << c.name;
  }
  const std::string path = at(kSpool + std::string("0000000001-log-tallyd.log"));
  EXPECT_EQ(run({"report", "show", path, "--json"}).json()["document"]["TBScalars"]["a"], 20);
  EXPECT_THAT(run({"report", "show", "3"}).out, HasSubstr("worn: no\nname: \\x1b[31m\n"));
  // The content of a file decides how it is shown.
  putPlist("records", "<dict><key>RecordType</key><integer>172</integer></dict>");
  putPlist("other", "<dict/>");
  put("text", "worn: no\n");
  put("bytes", "\xff\x01");
  const struct {
    const char* file;
    int status;
    const char* says;
  } files[] = {{"records", kSuccess, "172"},
               {"other", kWrong, "is a property list, but not a daily log"},
               {"text", kSuccess, "worn: no\n"},
               {"bytes", kWrong, "is damaged"}};
  for (const auto& c : files) {
    const Outcome outcome = run({"report", "show", at(c.file)});
    EXPECT_EQ(outcome.status, c.status) << c.file;
    EXPECT_THAT(outcome.out + outcome.err, HasSubstr(c.says));
  }
}

}  // namespace
}  // namespace tally::tools
