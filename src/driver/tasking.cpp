#include "driver/tasking.h"

#include <fmt/format.h>

#include <algorithm>
#include <map>
#include <set>
#include <utility>

#include "platform/platform.h"
#include "report/report.h"

namespace tally {
namespace {

using Owner = PreferenceWrite::Owner;

constexpr std::string_view kUnfinished = "TaskingUnfinished";

struct Attempt {
  PreferenceWrite write;
  WriteResult result;
};
using Attempts = std::vector<Attempt>;

void record(std::string_view key, KvRef<KvObject> value) {
  platform().preferences->SMAPreferencesSetValue(key, std::move(value), kProgramDomain);
}

bool flushRecord() {
  return static_cast<bool>(platform().preferences->SMAPreferencesSynchronize(kProgramDomain));
}

WriteResult attempt(const PreferenceWrite& write, bool sync) {
  switch (write.owner) {
    case Owner::Program:
      platform().preferences->SMAPreferencesSetValue(write.key, write.value, write.domain);
      return WriteResult::Written;  // until its domain is flushed
    case Owner::System:
      return platform().systemConfiguration->setPreference(write.key, write.value, write.domain,
                                                           sync);
    case Owner::User:
      break;
  }
  SMAServicesClient& services = *platform().servicesClient;
  return write.value ? services.setPreference(write.key, write.user, write.domain, write.value)
                     : services.deletePreference(write.key, write.user, write.domain);
}

Attempts attemptAll(const std::vector<PreferenceWrite>& writes, bool sync) {
  Attempts attempts;
  for (const PreferenceWrite& write : writes) attempts.push_back({write, attempt(write, sync)});
  return attempts;
}

// The program's own domain is flushed with the record, which tells whether that was done.
void flushDomains(std::initializer_list<Attempts*> all) {
  std::map<std::string, WriteResult> flushed{{std::string(kProgramDomain), WriteResult::Written}};
  for (Attempts* attempts : all) {
    for (auto& [write, result] : *attempts) {
      if (write.owner != Owner::Program) continue;
      auto known = flushed.find(write.domain);
      if (known == flushed.end()) {
        const auto outcome = platform().preferences->SMAPreferencesSynchronize(write.domain);
        known = flushed.emplace(write.domain, outcome).first;
      }
      result = known->second;
    }
  }
}

// Those that the next run has to try again, and a line for each that was not done.
std::vector<PreferenceWrite> failuresOf(const Attempts& attempts, std::string_view what) {
  std::vector<PreferenceWrite> failures;
  for (const auto& [write, result] : attempts) {
    if (result) continue;
    logBounded(LogLevel::Error, "tasking: entries not done", "tasking: {} {} of {} {}",
               write.domain, write.key, write.user,
               result.isRefused() ? fmt::format("is refused and not {}", what)
                                  : fmt::format("could not be {}; the next run tries again", what));
    if (!result.isRefused()) failures.push_back(write);
  }
  return failures;
}

// Leaves in the change what remains to be done. True when a preference was set or removed.
bool carryOutWrites(TaskingChange& change) {
  Attempts removals = attemptAll(change.removals, /*sync=*/false);
  Attempts writes = attemptAll(change.writes, /*sync=*/true);
  flushDomains({&removals, &writes});
  const auto isDone = [](const Attempt& one) { return static_cast<bool>(one.result); };
  const bool hasEffect =
      std::ranges::any_of(removals, isDone) || std::ranges::any_of(writes, isDone);
  change.writes = failuresOf(writes, "set");
  // A later run must not remove what was set, or will be.
  std::set<PreferenceName> set;
  for (const auto& [write, result] : writes) {
    if (!result.isRefused()) set.insert(write.name());
  }
  std::erase_if(removals, [&](const Attempt& one) { return set.contains(one.write.name()); });
  change.removals = failuresOf(removals, "removed");
  return hasEffect;
}

// The record of what is in force is written in one file with the removal of the note, and last.
void recordOutcome(const TaskingChange& change, bool isFinished) {
  if (!isFinished) {
    record(kUnfinished, unfinishedRecord(change));
    return;
  }
  if (change.payload) {
    record("TaskingID", change.id);
    record("TaskingOS", change.system);
    record("TaskingDigest", change.digest);
    record("TaskingPayload", change.payload);
  }
  record(kUnfinished, nullptr);
}

struct Outcome {
  bool isFinished, isNews;
};

// A run may die between any two steps. So all that is to be done is noted first, and a tasking that
// is about to be rolled back is no longer recorded as the one in force. A later run that finds the
// note carries out what it lists.
Outcome carryOutChange(TaskingChange change, bool endsRecorded) {
  record(kUnfinished, unfinishedRecord(change));
  if (endsRecorded) {
    for (const char* key : {"TaskingID", "TaskingDigest", "TaskingPayload"}) record(key, nullptr);
  }
  if (!flushRecord()) {
    logMessage(LogLevel::Error, "tasking: nothing is changed, since it could not be noted first");
    return {false, false};
  }
  const bool hasEffect = carryOutWrites(change);
  const bool isFinished = change.removals.empty() && change.writes.empty();
  recordOutcome(change, isFinished);
  if (!flushRecord()) {
    logMessage(LogLevel::Error, "tasking: what was done is not recorded; the next run repeats it");
    return {false, hasEffect};
  }
  return {isFinished, hasEffect || isFinished};
}

}  // namespace

TaskingInputs readTaskingInputs() {
  Preferences& preferences = *platform().preferences;
  const auto recorded = [&](std::string_view key) {
    return preferences.SMAPreferencesGetValue(key, kProgramDomain);
  };
  TaskingInputs inputs;
  inputs.today = platform().metricsStore->TBDaysSince1970();
  if (const auto version = platform().deviceInformation->copySystemVersionDictionary()) {
    inputs.build = KvRef<KvString>::share(version->getAs<KvString>("ProductBuildVersion"));
  }
  inputs.lastUpdate = recorded("LastOSUpdate");
  inputs.schedule = platform().systemConfiguration->getPreference(kScheduleKey, kScheduleDomain);
  inputs.recordedID = recorded("TaskingID");
  inputs.recordedOS = recorded("TaskingOS");
  inputs.recordedPayload = recorded("TaskingPayload");
  inputs.unfinished = recorded(kUnfinished);
  return inputs;
}

bool carryOut(const TaskingPlan& plan) {
  for (const TaskingMessage& message : plan.messages) {
    logBounded(message.isFault ? LogLevel::Error : LogLevel::Default,
               message.isFault ? "tasking: entries skipped" : "tasking: messages", "{}",
               message.text);
  }
  if (plan.lastUpdate) record("LastOSUpdate", plan.lastUpdate);
  if (!plan.isDue) return true;
  const Outcome outcome =
      plan.change ? carryOutChange(*plan.change, plan.endsRecorded) : Outcome{true, true};
  if (outcome.isNews) platform().notifications->postSystemNotification(kTaskingNotification);
  return outcome.isFinished;
}

void updateTaskingState() { (void)carryOut(planTasking(readTaskingInputs())); }

}  // namespace tally
