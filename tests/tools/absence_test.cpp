// Why a key is not in a log: one reason each, that of the first place on its way where it stopped.
#include "tools/whitelist/absence.h"

#include <ctime>
#include <filesystem>

#include "host/store/store_schema.h"
#include "tools/tool_fixture.h"
#include "tools/whitelist/day_account.h"

namespace tally::tools {
namespace {

class AbsenceTest : public ToolTest {
 protected:
  void SetUp() override {
    putWhitelist(R"({"G": {"ScalarKeys": {"a": {}, "bad": {}, "late": {}, "s": {},
                            "vellum.kernel.memorystatus_thaw_count": {},
                            "vellum.memorystatus_freezer_error_other_count": {}},
                           "DistributionKeys": {"d": {}}},
                     "Off": {"ScalarKeyPrefixes": {"off.": {}}, "DistributionKeys": {"off.s": {}}},
                     "InternalTesting": {"ScalarKeys": {"secret": {}}}})");
    putList(kDescription, R"({"KernelValues": {"kern.memorystatus_thaw_count": 31,
        "kern.memorystatus_freezer_process_considered_count": 0,
        "kern.memorystatus_freezer_error_other_count": 2}})");
    putList(kPreferences + "vellum.da.plist", R"({"Off": false})");
    setProcessed(20000);
    putRows(
        "scalar,a,20000,,7\nscalar,bad,20000,,7\nscalar,late,19999,,7\nscalar,un,20000,,1\n"
        "scalar,off.x,20000,,1\nscalar,off.s,20000,,1\nscalar,secret,20000,,1\n"
        "scalar,d,20000,,1\ndistribution,d,20000,1,1\ndistribution,s,20000,1,1\n"
        "scalar,a,20001,,7\n");
    auto store = openStoreForWriting(metricsStoreFile(DeviceRoot(at("device"))), IfMissing::Leave);
    ASSERT_TRUE(store && *store);
    ASSERT_TRUE((*store)->execute("UPDATE scalars SET value = 'seven' WHERE key = 'bad'"));
  }
  void setProcessed(int day) const {
    putList(kPreferences + "vellum.tallyd.tallyrun.plist",
            fmt::format(R"({{"LastCrashLogSerializationDateInDaysSince1970": {}}})", day));
  }
  // "scalar not_listed", a line for each kind that has a reason.
  std::string reasons(const std::string& key, const std::string& day) {
    const auto document = run({"explain", key, "--day", day, "--json"}).json();
    std::string text;
    if (!document.contains("absence")) return text;
    for (const auto& [kind, reason] : document["absence"].items()) {
      text += (text.empty() ? "" : ", ") + kind + " " + reason.get<std::string>();
    }
    return text;
  }
};

TEST_F(AbsenceTest, TheFirstObstacleIsTheReason) {
  const auto allow = [this](bool allowed) {
    putList(kPreferences + "vellum.tallyd.plist",
            fmt::format(R"({{"DiagnosticSubmissionEnabled": {}}})", allowed));
  };
  const struct {
    std::string key, reasons;
    std::string day = "20000";
    std::function<void()> change = [] {};
  } cases[] = {
      {"a", ""},
      {"bad", "distribution no_value_that_day, scalar unreadable"},
      {"late", "scalar no_value_that_day"},
      {"un", "scalar not_listed"},
      {"off.x", "scalar group_off"},
      {"off.s", "scalar group_off"},  // not as the other kind, which is off as well
      {"secret", "scalar group_off"},
      {"d", "scalar other_section"},
      {"s", "distribution other_section"},
      {"vellum.kernel.memorystatus_thaw_count", ""},
      {"vellum.memorystatus_freezer_error_other_count", "scalar unreadable"},
      {"vellum.kernel.memorystatus_thaw_count", "scalar no_value_that_day", "20002"},
      {"a", "scalar day_not_processed", "20001"},
      {"un", "scalar not_listed", "20000", [&] { allow(false); }},
      {"a", "scalar submission_forbidden", "20001"},
      // A log that was submitted has it; another day was passed over.
      {"a", "", "20000",
       [&] {
         allow(true);
         submit(20000);
         setProcessed(20002);
       }},
      {"a", "scalar day_not_processed", "20001"},
      {"late", "scalar no_value_that_day"},
      // What was submitted stays so; what was not is another whitelist's.
      {"a", "", "20000", [&] { putWhitelist(R"({"G": {"ScalarKeys": {"un": {}}}})"); }},
      {"un", "scalar not_listed"},
      {"off.x", "scalar unreadable", "20000",
       [&] {
         putWhitelist(R"({"Off": {"ScalarKeys": {"off.x": {}}}})");
         std::filesystem::remove(at(kPreferences + "vellum.da.plist"));
         std::filesystem::create_symlink("elsewhere", at(kPreferences + "vellum.da.plist"));
       }},
      {"un", "scalar unreadable", "20000", [&] { put(kWhitelist, "damaged"); }},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.key + " on " + c.day + ", " + c.reasons);
    c.change();
    EXPECT_EQ(reasons(c.key, c.day), c.reasons);
  }
}

TEST(Absence, WithoutAValueTheCloserReasonIsGiven) {
  constexpr std::string_view kWhy = "a set (type s), which the store cannot hold";
  const struct {
    bool stored, damaged, storeFails, elsewhen;
    std::string_view refusal;
    std::optional<Absence> absence;
  } cases[] = {
      {true, true, false, false, kWhy, std::nullopt},
      {false, true, false, false, kWhy, Absence::Unreadable},
      {false, false, true, false, kWhy, Absence::Unreadable},
      {false, false, false, true, kWhy, Absence::RefusedByRecorder},
      {false, false, false, true, "", Absence::NoValueThatDay},
  };
  for (const auto& c : cases) {
    ValueState value;
    value.stored = c.stored;
    value.damaged = c.damaged;
    value.storeFails = c.storeFails;
    value.elsewhen = c.elsewhen;
    value.refusal = c.refusal;
    const auto why = whyNoValue(value);
    EXPECT_EQ(why ? std::optional(why->absence) : std::nullopt, c.absence);
  }
}

// The account of a day says of each key what explain says of it alone.
TEST_F(AbsenceTest, AWholeDayIsAccountedForAsEachKeyIs) {
  const PlatformScope scope(makeHostPlatform(at("device"), {log, true}));
  ToolContext context;
  context.root = at("device");
  context.platform = &platform();
  const WhitelistJudge judge(platform(), loadWhitelistFile(platform()));
  const DayAccount account = accountOfDay(context, judge, 20000, nullptr, AccountScope::Store);
  EXPECT_FALSE(account.unsent);
  std::size_t compared = 0;
  for (const KeyAccount& key : account.keys) {
    if (key.value.measured) continue;  // it was not asked what can be measured
    const auto document = run({"explain", key.key, "--day", "20000", "--json"}).json();
    const std::string kind(kindName(key.kind));
    const std::string alone = document.contains("absence") && document["absence"].contains(kind)
                                  ? document["absence"][kind].get<std::string>()
                                  : "";
    EXPECT_EQ(key.absence ? rowOf(key.absence->absence).name : "", alone) << key.key;
    ++compared;
  }
  EXPECT_EQ(compared, 10U);
  const auto absent = run({"whitelist", "absent", "--day", "20000", "--json"}).json();
  EXPECT_EQ(absent["keys"].size(), 11U);  // two that are measured; one is of another day
  expectParts(run({"whitelist", "absent", "--day", "20000", "--all"}).out,
              {"12  keys in all\n", "late", "named only by the prefix off. of the group Off"});
  ASSERT_NE(account.find("d", KeyKind::Distribution), nullptr);
  EXPECT_EQ(account.find("d", KeyKind::Distribution)->section(),
            WhitelistSection::DistributionKeys);
  EXPECT_EQ(account.find("late", KeyKind::Distribution), nullptr);
}

// Each of very many keys is found among as many entries without a look at all of them.
TEST_F(AbsenceTest, ALargeDayTakesLittleTime) {
  constexpr int kKeys = 100000;
  std::string entries, rows;
  for (int i = 0; i < kKeys; ++i) {
    entries += fmt::format("<key>k{}.{}</key><dict/>", i % 7, i);
    rows += fmt::format("scalar,k{}.{}.x,20003,,1\n", i % 7, i);
  }
  putPlist(kWhitelist, "<dict><key>G</key><dict><key>ScalarKeyPrefixes</key><dict>" + entries +
                           "</dict></dict></dict>");
  putRows(rows);
  const PlatformScope scope(makeHostPlatform(at("device"), {log, true}));
  ToolContext context;
  context.root = at("device");
  context.platform = &platform();
  const std::clock_t start = std::clock();
  const WhitelistJudge judge(platform(), loadWhitelistFile(platform()));
  const DayAccount account = accountOfDay(context, judge, 20003);
  // Of the processor; a look at every entry for every key would take minutes.
  EXPECT_LT(std::clock() - start, 5 * CLOCKS_PER_SEC);
  EXPECT_EQ(std::ranges::count_if(account.keys, [](const KeyAccount& k) { return !k.absence; }),
            kKeys);
}

}  // namespace
}  // namespace tally::tools
