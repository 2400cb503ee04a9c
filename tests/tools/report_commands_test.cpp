// tallyctl report: a preview is the log that follows, and leaves no trace.
#include "kv/plist_codec.h"
#include "tools/tool_fixture.h"

namespace tally::tools {
namespace {

using testing::HasSubstr;
using testing::Not;

const std::string kFirst = kSpool + "0000000001-log-tallyd.log";

class ReportCommands : public ToolTest {
 protected:
  void SetUp() override {
    putList(kDescription, R"({"MonotonicTicks": 7200000000000, "RegionCode": "CH"})");
    putWhitelist(R"({"G": {"ScalarKeys": {"a": {"sig_fig": 1}, "b": {},
                         "vellum.usage.cur_boot_session_cpu_uptime": {},
                         "vellum.sysmetra.tlyd.database.corruptions": {}},
                         "DistributionKeys": {"d": {"intervals": [2, 5.0]}}}})");
    putList(kPreferences + "vellum.tallyd.plist", R"({"DatabaseCorruptionCount": 3})");
    putRows(
        "scalar,a,20000,,17\nscalar,b,20000,,5\nscalar,secret,20000,,9\n"
        "distribution,d,20000,1,2\ndistribution,d,20000,2,4\ndistribution,d,20000,3,4\n"
        "distribution,d,20000,4,4\ndistribution,d,20000,5,5\ndistribution,d,20000,6,5\n"
        "distribution,d,20000,7,7\ndistribution,d,20000,8,9\n");
  }
  std::string body(int number) {
    return get(kSpool + fmt::format("{:010}-log-tallyd.log", number));
  }
};

TEST_F(ReportCommands, APreviewIsTheNextLogAndLeavesNoTrace) {
  // A damaged domain is set aside by the daily job, and must stay where it is here.
  put(kPreferences + "vellum.da.plist", "damaged");
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
  auto previewed = preview.json(), shown = run({"report", "show", "--json"}).json();
  for (auto* one : {&previewed, &shown}) (*one)["document"].erase("TBLogCreationDate");
  EXPECT_EQ(previewed["document"], shown["document"]);
  EXPECT_EQ(previewed["options"], shown["options"]);
  expectValues(shown, R"({"/standardDeviations/d": 2.0, "/document/TBScalars": {"a": 20, "b": 5,
      "vellum.sysmetra.tlyd.database.corruptions": 3,
      "vellum.usage.cur_boot_session_cpu_uptime": 120}})");
  EXPECT_NE(tree(), before);  // so that the comparison above could have failed
}

TEST_F(ReportCommands, TheDayIsDrawnForPeople) {
  submit(20000);
  const std::string shown = run({"report", "show"}).out;
  expectParts(shown,
              {"Daily log of day 20000 (2024-10-04)", "Scalars, 4 keys",
               "  a                                             20\n",
               "key  count  min  mean  std dev  max", "  d        8    2     5        2    9",
               "    (-inf, 2]  1  12.5 %  ███████▎\n",
               "       (2, 5]  5  62.5 %  ████████████████████████████████████\n",
               "     (5, inf)  2  25.0 %  ██████████████▍\n", "region               CH"});
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
  putList(kDescription, R"({"MonotonicTicks": 7200000000000})");
  const auto diff = run({"report", "preview", "--day", "20001", "--diff", "--json"}).json();
  expectValues(diff, R"json({"/before/day": 20000, "/after/day": 20001, "/scalars":
      {"added": {}, "removed": {"a": 20}, "changed": {"b": {"before": 5, "after": 8, "delta": 3},
       "vellum.sysmetra.tlyd.database.corruptions": {"before": 3, "after": 0, "delta": -3}}},
      "/distributions/changed/d/after": [2.0, 9.0, 5.5, 24.5, 2],
      "/histograms/changed/d/after": {"(-inf, 2]": 1, "(5, inf)": 1},
      "/metadata/removed": {"TBUserSetRegionFormat": "CH"}})json");
  const std::string text = run({"report", "preview", "--day", "20001", "--diff"}).out;
  expectParts(
      text, {"Scalars: 0 added, 1 removed, 2 changed", "+3\n", "(2, 5]       5\n", "TBStartDate"});
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
  for (const bool halved : {true, false}) {
    put(kFirst,
        halved ? sound.substr(0, sound.size() / 2) : "<plist version=\"1.0\"><dict/></plist>");
    const char* const fault = halved ? "damaged" : "not a daily log";
    for (const bool json : {false, true}) {
      const Outcome outcome = json ? run({"report", "show", "--json"}) : run({"report", "show"});
      EXPECT_EQ(outcome.status, kWrong);
      EXPECT_THAT(outcome.err, HasSubstr(fault));
    }
    EXPECT_THAT(run({"report", "list"}).out, HasSubstr(fault));
    EXPECT_THAT(run({"doctor"}).out,
                HasSubstr(std::string("0000000001-log-tallyd.log is ") + fault));
  }
  // Parts of the wrong type are shown as what they are.
  putList(kFirst, R"({"TBCrashLogVersion": 1, "TBDistributions": {"d": [true]},
                     "TBDistributionsHistogram": {"d": "x"}, "TBScalars": []})");
  const Outcome odd = run({"report", "show"});
  EXPECT_EQ(odd.status, kSuccess);
  expectParts(odd.out, {"an unknown day", "d    damaged"});
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
  expectValues(list, R"({"/1/day": 20000, "/1/keys": 5, "/2/day": null})");
  EXPECT_EQ(list[1]["bytes"], body(2).size());
  const std::string storage = "0000000003-StorageStatus.log";
  EXPECT_EQ(run({"report", "show", "--json"}).json()["file"], "0000000002-log-tallyd.log");
  EXPECT_EQ(run({"report", "show", "--json", "1"}).json()["file"], "0000000001-log-tallyd.log");
  EXPECT_EQ(run({"report", "show", "--json", storage}).json()["file"], storage);
  const std::string path = at(kFirst);
  EXPECT_EQ(run({"report", "show", path, "--json"}).json()["document"]["TBScalars"]["a"], 20);
  EXPECT_THAT(run({"report", "show", "3"}).out, HasSubstr("worn: no\nname: \\x1b[31m\n"));
  // The content of a file decides how it is shown.
  const struct {
    std::string content;
    int status;
    const char* says;
  } files[] = {
      {"<plist><dict><key>RecordType</key><integer>172</integer></dict></plist>", kSuccess, "172"},
      {"<plist><dict/></plist>", kWrong, "is a property list, but not a daily log"},
      {"worn: no\n", kSuccess, "worn: no\n"},
      {"\xff\x01", kWrong, "is damaged"}};
  for (const auto& c : files) {
    put("file", c.content);
    const Outcome outcome = run({"report", "show", at("file")});
    EXPECT_EQ(outcome.status, c.status) << c.says;
    EXPECT_THAT(outcome.out + outcome.err, HasSubstr(c.says));
  }
}

}  // namespace
}  // namespace tally::tools
