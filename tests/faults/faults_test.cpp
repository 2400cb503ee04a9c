// Walks: each call of a daily run on a file or the store fails once, or is the last of the run.
//
// What must be true after any run:
// - Preference files, the store and the logs in the spool are whole at any moment.
// - The day that is noted as processed is the former one or yesterday, and yesterday only when all
//   of the day's tasks have been attempted. A task that fails does not prevent this: an error line
//   says what is lost. A run that died earlier has not noted the day, so the next one does it.
// - What a service has acknowledged survives a power cut, at once or later.
// - The next run without a fault completes everything, whatever it finds.
#include <gtest/gtest.h>

#include <fmt/format.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <optional>
#include <set>

#include "base/files/directory.h"
#include "base/files/file.h"
#include "base/files/temporary_file.h"
#include "faults/sample_device.h"
#include "host/spool/sequence_folder.h"
#include "host/spool/structured_data.h"
#include "host/store/sqlite_database.h"

namespace tally::faults {

void PrintTo(const Fault& fault, std::ostream* out) { *out << fault.name; }

namespace {

namespace fs = std::filesystem;
using Effect = Fault::Effect;

// A lasting fault meets most calls many times, so every third start is enough.
const Fault kFaults[] = {
    {"NoSpace", Effect::Fail, kNoSpace, ENOSPC},
    {"NoSpaceFromThere", Effect::Fail, kNoSpace, ENOSPC, 3, true},
    {"InputOutput", Effect::Fail, kInputOutput, EIO},
    {"InputOutputFromThere", Effect::Fail, kInputOutput, EIO, 3, true},
    {"Denied", Effect::Fail, kDenied, EACCES},
    {"DeniedFromThere", Effect::Fail, kDenied, EACCES, 3, true},
    // Killed right after a call is killed before the next: between two calls nothing changes.
    {"Killed", Effect::Kill, kLastCall},
    {"KilledHalfWay", Effect::KillHalfWay, kHalfWrite},
    {"PowerCut", Effect::PowerCut, kLastCall},
    {"PowerCutAfterNames", Effect::PowerCut, kLastCall, 0, 1, false, Loss::Contents},
    {"PowerCutAtRandom", Effect::PowerCut, kLastCall, 0, 1, false, Loss::AtRandom},
    {"Interrupted", Effect::Fail, kInterrupted, EINTR},
    {"HalfWritten", Effect::WriteHalf, kShortWrite},
    // A run allocates some ten thousand times; a prime, so that no loop keeps step with it.
    {"OutOfMemory", Effect::Fail, kNoMemory, ENOMEM, 311},
};

struct Scenario {
  const char* name;
  std::int32_t day;
  const char* folder;  // whose calls meet the fault
  bool hasStore = true;
};

const Scenario kScenarios[] = {
    {"the whole day", kDay, ""},
    {"a day of events", kDay + 1, "/var/mobile/Library/Logs/AnalyticsEvents"},
    {"a day without a store", kDay, "/var/mobile/Library/Tallybook", false},
};
// With fewer, the calls of the whole day would not be intercepted at all.
constexpr long kFewestCalls = 20;

constexpr std::size_t kStorageRecordsOfADay = 9;

std::size_t countIn(std::string_view text, std::string_view part) {
  std::size_t count = 0;
  for (auto at = text.find(part); at != std::string_view::npos; at = text.find(part, at + 1)) {
    ++count;
  }
  return count;
}

const char* const kSpool = "/var/mobile/Library/Logs/Submission";
const char* const kStructuredData = "/var/mobile/Library/Logs/StructuredData";
const char* const kRepairLogs = "/var/mobile/Library/Logs/Fixline";
const char* const kPreferences = "/var/mobile/Library/Preferences";
const char* const kTaskedFolders[] = {kPreferences, "/Library/Preferences",
                                      "/var/guest/Library/Preferences"};

class FaultWalk : public testing::TestWithParam<Fault> {
 protected:
  static void SetUpTestSuite() {
    watchStore();
    device = new SampleDevice;
  }
  static void TearDownTestSuite() {
    delete device;
    device = nullptr;
  }

  const Fault& fault() const { return GetParam(); }

  std::int64_t notedDay() const {
    const auto own = dictionaryIn(device->at(kPreferences) + "/vellum.tallyd.tallyrun.plist");
    return own ? own->getInt64("LastCrashLogSerializationDateInDaysSince1970").value_or(0) : 0;
  }

  // The days whose logs are in the spool. Every log there is whole.
  std::multiset<std::int32_t> loggedDays() const {
    std::multiset<std::int32_t> days;
    for (const std::string& path : device->files(kSpool)) {
      if (!path.ends_with(".log")) continue;
      const auto info = dictionaryIn(path.substr(0, path.size() - 4) + ".info.plist");
      EXPECT_TRUE(info && info->contains("CreationTime")) << path;
      const auto text = readFile(path, 1u << 24);
      if (path.ends_with("-StorageStatus.log")) {
        EXPECT_TRUE(text->starts_with("System ID: ") && text->ends_with("\n")) << *text;
        continue;
      }
      const auto log = dictionaryIn(path);
      if (!log) {
        ADD_FAILURE() << path << " is not a whole log";
        continue;
      }
      const auto day =
          static_cast<std::int32_t>(log->getAs<KvDate>("TBStartDate")->secondsSince1970() / 86400);
      const auto* const scalars = log->getAs<KvDictionary>("TBScalars");
      const auto* const times = log->getAs<KvDictionary>("TBDistributions")->getAs<KvArray>("time");
      const bool whole = scalars->getInt64("count") == countOf(day) && times != nullptr &&
                         times->getAs<KvNumber>(4)->asInt64() == kSamples;
      if (whole) days.insert(day);
    }
    return days;
  }

  void checkNothingIsDamaged() const {
    for (const std::string& path : device->files("")) {
      if (path.find("/Preferences/") == std::string::npos) continue;
      EXPECT_EQ(path.find(".damaged"), std::string::npos) << path;
      if (path.ends_with(".plist")) {
        EXPECT_TRUE(dictionaryIn(path)) << path;
      }
    }
    for (const std::string& path : device->files("/var/mobile/Library/Tallybook")) {
      EXPECT_EQ(std::filesystem::status(path).permissions(), std::filesystem::perms{0600}) << path;
    }
    std::multiset<std::string> repairLogs;
    for (const std::string& path : device->files(kRepairLogs)) {
      repairLogs.insert(*readFile(path, 100));
    }
    EXPECT_EQ(repairLogs, (std::multiset<std::string>{"new", "old", "older"}));
    (void)loggedDays();
    checkRecordedTasking();
    const auto noted = notedDay();
    EXPECT_TRUE(noted == kFormerRun - 1 || noted == scenario.day - 1) << noted;
    checkStore();
  }

  // With a day: it also holds what was swept on that day.
  void checkStore(std::optional<std::int32_t> sweptOn = std::nullopt) const {
    const std::string copy = device->copyOfStore();
    if (copy.empty()) {
      EXPECT_FALSE(scenario.hasStore || sweptOn);
      return;
    }
    auto store = Database::openAtPath(copy, Database::Access::ReadWrite);
    ASSERT_TRUE(store);
    auto check = store->prepare("PRAGMA integrity_check");
    ASSERT_TRUE(check) << check.error().message;
    ASSERT_EQ(check->step(), Step::Row);
    EXPECT_EQ(check->text(0), "ok");
    if (sweptOn) {
      const auto swept = store->integer(
          "SELECT count(*) FROM scalars WHERE key GLOB 'vellum.dockyard.*' AND day = " +
          std::to_string(*sweptOn));
      EXPECT_TRUE(swept && *swept > 0);
    }
    if (!scenario.hasStore) return;
    for (const std::int32_t day : {kDay - 1, kDay}) {
      const auto rows = std::to_string(day);
      const auto count =
          store->integer("SELECT value FROM scalars WHERE key = 'count' AND day = " + rows);
      EXPECT_TRUE(count && *count == countOf(day)) << day;
      const auto samples = store->integer(
          "SELECT sum(samples) FROM (SELECT day, key, samples FROM series UNION ALL "
          "SELECT day, key, samples FROM arrivals) "
          "WHERE key = 'time' AND day = " +
          rows);
      EXPECT_TRUE(samples && *samples == kSamples) << day;
    }
  }

  // After a run of that day in which nothing failed.
  void checkDone(std::int32_t day, const char* tasking = "present") const {
    checkRecorded(day, tasking);
    for (const std::string& path : device->files("")) {
      EXPECT_FALSE(isTemporaryName(path) || path.ends_with(".pending")) << path;
    }
    checkEvents();
    checkRepairLogs();
  }

  // The same but for what the next run tidies up.
  void checkRecorded(std::int32_t day, const char* tasking) const {
    EXPECT_EQ(notedDay(), day - 1);
    if (scenario.hasStore) {
      EXPECT_TRUE(loggedDays().contains(day - 1));
    }
    checkStructuredData(kStorageRecordsOfADay);
    checkStore(day);
    checkTasking(tasking);
  }

  // The last log of the storage, which is newer than the one of that number, has at least so many
  // records.
  void checkStructuredData(std::size_t records, std::uint64_t formerLog = 0) const {
    std::size_t found = 0;
    for (const std::string& path : device->files(kStructuredData)) {
      if (sequenceOf(fs::path(path).filename().native()).value_or(0) <= formerLog) continue;
      if (path.ends_with(fmt::format("-{}.pending", kStorageRecordType))) {
        const auto bytes = readFile(path, 1u << 24);
        found = countIn(bytes->substr(0, wholeRecords(*bytes)), "</plist>");
      }
      if (!path.ends_with(".plist")) continue;
      const auto log = dictionaryIn(path);
      ASSERT_TRUE(log) << path;
      if (log->getInt64("RecordType") == kStorageRecordType) {
        found = log->getAs<KvArray>("Records")->size();
      }
    }
    EXPECT_GE(found, records);
  }

  // How many lines are one whole event; the rest is said to be damaged.
  std::size_t wholeEvents(std::string* damaged = nullptr) const {
    std::size_t whole = 0;
    for (const std::string& path : device->files("/var/mobile/Library/Logs/AnalyticsEvents")) {
      if (!path.ends_with(".jsonl")) continue;
      std::ifstream lines(path);
      for (std::string line; std::getline(lines, line);) {
        const bool isWhole = line.rfind("{\"event\":") == 0 && line.ends_with("}}") &&
                             line.find('\0') == std::string::npos;
        whole += isWhole;
        if (!isWhole && damaged != nullptr) *damaged = line;
      }
    }
    return whole;
  }
  void checkEvents() const {
    std::string damaged;
    (void)wholeEvents(&damaged);
    EXPECT_EQ(damaged, "");
  }

  std::uint64_t newestLogNumber(const char* folder) const {
    const auto logs = listSequenced(*Directory::open(device->at(folder)));
    return logs->empty() ? 0 : logs->back().sequence;
  }

  struct BeforeRun {
    std::size_t events;
    std::uint64_t lastLog, lastStructuredData;
  };

  // After a power cut.
  void checkAcknowledged(const Acknowledged& done, const BeforeRun& before) const {
    EXPECT_GE(wholeEvents(), before.events + done.events);
    EXPECT_GE(newestLogNumber(kSpool), before.lastLog + done.logs);
    if (done.records > 0) checkStructuredData(done.records, before.lastStructuredData);
    if (done.swept) checkStore(scenario.day);
    if (done.tasked) checkTasking("present");
  }

  // What is recorded as in force has been written, all of it.
  void checkRecordedTasking() const {
    const auto own = dictionaryIn(device->at(kPreferences) + "/vellum.tallyd.tallyrun.plist");
    const auto tasking = own ? own->getString("TaskingID") : std::nullopt;
    for (const char* const folder : kTaskedFolders) {
      const auto domain = dictionaryIn(device->at(folder) + "/dom.plist");
      EXPECT_TRUE(!tasking || (domain && domain->contains(*tasking))) << folder;
    }
  }

  // The scheduled tasking is in force, and nothing of another one is left.
  void checkTasking(const char* tasking) const {
    for (const char* const folder : kTaskedFolders) {
      const auto domain = dictionaryIn(device->at(folder) + "/dom.plist");
      ASSERT_TRUE(domain) << folder;
      EXPECT_EQ(kvText(domain.get()),
                kvText(KvDictionary::create({{tasking, KvNumber::int64(1)}}).get()))
          << folder;
    }
    const auto own = dictionaryIn(device->at(kPreferences) + "/vellum.tallyd.tallyrun.plist");
    EXPECT_EQ(own->getString("TaskingID"), tasking);
    EXPECT_TRUE(own->contains("TaskingDigest") && own->contains("TaskingPayload"));
    EXPECT_FALSE(own->contains("TaskingUnfinished"));
  }

  void checkRepairLogs() const {
    for (const std::string& path : device->files(kRepairLogs)) {
      EXPECT_FALSE(path.ends_with(".log")) << path << " is not rolled";
    }
  }

  void checkEnding(const Ending& ending, const BeforeRun& before) const {
    ASSERT_TRUE(ending.sound) << testing::PrintToString(ending.errors);
    checkNothingIsDamaged();
    const bool noted = notedDay() == scenario.day - 1;
    if (fault().isHarmless()) {
      EXPECT_EQ(ending.errors, std::vector<std::string>());
      EXPECT_TRUE(noted);
    }
    if (fault().effect == Effect::PowerCut) {
      checkAcknowledged(ending.acknowledged, before);
      EXPECT_TRUE(ending.killed || noted);
      if (noted) checkRecorded(scenario.day, "present");
      return;
    }
    if (ending.killed ? noted : fault().isHarmless()) checkDone(scenario.day);
    if (ending.killed) return;
    const bool logged = !scenario.hasStore || loggedDays().contains(scenario.day - 1);
    EXPECT_TRUE((noted && logged) || !ending.errors.empty());
  }

  // False when the walk is at its end.
  bool tryPoint(long point) {
    device->restore(scenario.hasStore);
    const BeforeRun before{wholeEvents(), newestLogNumber(kSpool),
                           newestLogNumber(kStructuredData)};
    const Ending ending = device->run(scenario.day, &fault(), point, scenario.folder);
    SCOPED_TRACE("call " + std::to_string(point) + ": " + describeCall() +
                 "; errors: " + testing::PrintToString(ending.errors));
    if (!ending.met) {
      EXPECT_EQ(ending.errors, std::vector<std::string>());
      if (fault().effect != Effect::PowerCut) checkDone(scenario.day);
    }
    if (ending.met || fault().effect == Effect::PowerCut) checkEnding(ending, before);
    if (!ending.met) return false;
    if (fault().isHarmless()) return true;
    // A day that is noted is not done again, so the next run with something to do is tomorrow's.
    const std::int32_t next = scenario.day + (notedDay() == scenario.day - 1 ? 1 : 0);
    // Every other time another tasking has been scheduled meanwhile.
    const char* const tasking = point % 2 == 0 ? "next" : "present";
    device->schedule(tasking);
    const Ending healthy = device->run(next);
    EXPECT_TRUE(healthy.sound);
    EXPECT_EQ(healthy.errors, std::vector<std::string>());
    SCOPED_TRACE("after the next run, of day " + std::to_string(next));
    checkDone(next, tasking);
    return true;
  }

  long pointsTried() {
    constexpr int kFailuresShown = 3;
    const long stride = FAULT_STRIDE * fault().stride;
    long tried = 0;
    int failures = 0;
    for (long point = 1; tryPoint(point); point += stride) {
      ++tried;
      if (HasFailure() && ++failures == kFailuresShown) break;
    }
    std::printf("%s: %ld points tried in %s\n", fault().name, tried, scenario.name);
    return tried * stride;
  }

  Scenario scenario = kScenarios[0];
  static SampleDevice* device;
};

SampleDevice* FaultWalk::device = nullptr;

TEST_P(FaultWalk, LeavesNothingThatTheNextRunDoesNotPutRight) {
  for (const Scenario& next : kScenarios) {
    scenario = next;
    const long calls = pointsTried();
    EXPECT_TRUE(*scenario.folder != '\0' || calls >= kFewestCalls) << calls;
  }
}

INSTANTIATE_TEST_SUITE_P(, FaultWalk, testing::ValuesIn(kFaults),
                         [](const auto& param) { return std::string(param.param.name); });

}  // namespace
}  // namespace tally::faults

// An exception ends a child as it ends the program: nothing catches it on its way.
int main(int count, char** arguments) {
  testing::InitGoogleTest(&count, arguments);
  GTEST_FLAG_SET(catch_exceptions, false);
  return RUN_ALL_TESTS();
}
