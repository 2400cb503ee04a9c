// tallyctl nand: what it shows of a driver's figures, and its exit statuses.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <nlohmann/json.hpp>

#include "fakes/fake_storage.h"
#include "tools/tool.h"

namespace tally::tools {
namespace {

using fakes::Record;
using testing::HasSubstr;
using testing::Not;

struct Outcome {
  int status;
  std::string out, err;
};

std::string contentOf(std::FILE* file) {
  std::string text(static_cast<std::size_t>(std::ftell(file)), '\0');
  std::rewind(file);
  EXPECT_EQ(std::fread(text.data(), 1, text.size(), file), text.size());
  std::fclose(file);
  return text;
}

Outcome runOn(const fakes::FakeStorage& storage, std::vector<const char*> arguments) {
  arguments.insert(arguments.begin(), {"tallyctl", "nand"});
  ToolContext context;
  context.root = "/";
  context.out = std::tmpfile();
  context.err = std::tmpfile();
  testing::internal::CaptureStderr();
  const int status =
      runTool(context, arguments, [&](const std::string&) { return storage.services(); });
  testing::internal::GetCapturedStderr();
  return {status, contentOf(context.out), contentOf(context.err)};
}

// Runs on a device whose driver exports these records; none: a device without a driver.
Outcome run(const std::vector<const char*>& arguments, std::vector<Record> records) {
  fakes::FakeStorage storage;
  if (records.empty()) storage.registry->classes.clear();
  records.insert(records.begin(), {53, {0x20002}});
  storage.registry->serve(fakes::statisticsBuffer(records));
  storage.purgeableSpace->answer =
      KvDictionary::create({{"RECLAIM_TOTAL_AVAILABLE", KvNumber::int64(5)},
                            {"RECLAIM_NONPURGEABLE_AMOUNT", KvNumber::int64(6)}});
  return runOn(storage, arguments);
}

constexpr std::uint32_t kSpareAvailable = 532, kUserPartitionUsed = 431, kReads = 7, kHisto = 327,
                        kHostReadErrors = 172;

TEST(NandCommands, InfoInGroups) {
  const Outcome info = run({"info"}, {{kReads, {1'234'567}}, {kHisto, {1, 9, 3}}, {121, {5, 6}}});
  EXPECT_EQ(info.status, kSuccess);
  for (const char* line : {"Device\n", "NumLogicalReads", "1,234,567", "BandsMaxTempHisto0-2",
                           "1 9 3", "ReadsBeforeErasure50000", "PadSize1-2"}) {
    EXPECT_THAT(info.out, HasSubstr(line));
  }
  EXPECT_THAT(info.out, Not(HasSubstr("vellum.NANDInfo")));
  EXPECT_THAT(info.err, HasSubstr("VMFreezer NAND writes"));

  const Outcome some = run({"info", "Histo"}, {{kReads, {1}}, {kHisto, {1, 9, 3}}});
  EXPECT_THAT(some.out, HasSubstr("BandsMaxTempHisto0-2"));
  EXPECT_THAT(some.out, Not(HasSubstr("NumLogicalReads")));
  EXPECT_EQ(run({"info", "no such"}, {{kReads, {1}}}).status, kWrong);
}

TEST(NandCommands, InfoForPrograms) {
  const Outcome info = run({"info", "--json"}, {{kReads, {~0ull}}});
  const auto json = nlohmann::json::parse(info.out);
  EXPECT_EQ(json["vellum.NANDInfo.NumLogicalReads"], -1);
  EXPECT_EQ(json["vellum.NANDInfo.Reclaim.TotalPurgeableBytes"], 5);
  const Outcome none = run({"info", "--json"}, {});
  EXPECT_EQ(none.status, kWrong);
  EXPECT_EQ(nlohmann::json::parse(none.out)["vellum.NANDInfo.Error"], "1");
}

TEST(NandCommands, HealthDecidesTheStatus) {
  const struct {
    std::vector<Record> records;
    int status;
    const char* says;
  } cases[] = {
      {{{kSpareAvailable, {98}}, {kUserPartitionUsed, {9}}}, kSuccess, "98 %"},
      {{{kSpareAvailable, {3}}}, kSuccess, "Nothing says"},
      {{{kSpareAvailable, {2}}}, kWrong, "should be retired"},
      // A group of which nothing is exported is no wear of 0; one counter of it is enough.
      {{{kReads, {1}}}, kSuccess, "Wear, most used part              not exported"},
      {{{kReads, {1}}}, kSuccess, "End-to-end errors, worst counter  not exported"},
      {{{kHostReadErrors, {7}}}, kSuccess, "Host read errors                             7"},
      {{}, kWrong, ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.says);
    const Outcome health = run({"health"}, c.records);
    EXPECT_EQ(health.status, c.status);
    EXPECT_THAT(health.out, HasSubstr(c.says));
    const Outcome json = run({"health", "--json"}, c.records);
    EXPECT_EQ(json.status, c.status);
    EXPECT_EQ(nlohmann::json::parse(json.out).contains("error"), c.records.empty());
  }
  EXPECT_EQ(run({"wealth"}, {}).status, kBadUsage);
}

TEST(NandCommands, EventsAreShownAndNotSent) {
  const Outcome events = run({"events"}, {{kReads, {1'234'567}}});
  EXPECT_EQ(events.status, kSuccess);
  EXPECT_THAT(events.out, HasSubstr("1,234,567"));
  EXPECT_THAT(events.out, HasSubstr("35 events, 35 of them wanted; nothing was sent."));
  EXPECT_THAT(events.out, HasSubstr("to the metrics store"));
  const Outcome some = run({"events", "NANDInfo_6", "--json"}, {{41, {9}}});
  const auto json = nlohmann::json::parse(some.out);
  EXPECT_EQ(json["serviceAvailable"], true);
  ASSERT_EQ(json["events"].size(), 1u);
  EXPECT_EQ(json["events"][0]["payload"]["clogProgram"], 9);
  EXPECT_EQ(run({"events", "no such"}, {}).status, kWrong);

  fakes::FakeStorage storage;
  storage.analyticsEvents->available = false;
  EXPECT_EQ(runOn(storage, {"events"}).status, kWrong);
  EXPECT_TRUE(storage.analyticsEvents->offered.empty());
}

}  // namespace
}  // namespace tally::tools
