#include "driver/tasking.h"

#include <fmt/core.h>

#include <algorithm>
#include <map>
#include <set>
#include <utility>

#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

using Owner = PreferenceWrite::Owner;

// The record of the tasking in force, and of the change to the next one.
constexpr const KnownPreference& kID = knownPreference("TaskingID");
constexpr const KnownPreference& kSystem = knownPreference("TaskingOS");
constexpr const KnownPreference& kDigest = knownPreference("TaskingDigest");
constexpr const KnownPreference& kPayload = knownPreference("TaskingPayload");
constexpr const KnownPreference& kUnfinished = knownPreference("TaskingUnfinished");
constexpr const KnownPreference& kLastUpdate = knownPreference("LastOSUpdate");
constexpr const KnownPreference& kSchedule = knownPreference("ScheduledTasking");

struct Attempt {
  PreferenceWrite write;
  WriteResult result;
};
using Attempts = std::vector<Attempt>;

bool flushRecord(Preferences& record) {
  return static_cast<bool>(record.SMAPreferencesSynchronize(kProgramDomain));
}

WriteResult attempt(Platform& platform, const PreferenceWrite& write, bool sync) {
  switch (write.owner) {
    case Owner::Program:
      platform.preferences->SMAPreferencesSetValue(write.key, write.value, write.domain);
      return WriteResult::Written;  // until its domain is flushed
    case Owner::System:
      return platform.systemConfiguration->setPreference(write.key, write.value, write.domain,
                                                         sync);
    case Owner::User:
      break;
  }
  SMAServicesClient& services = *platform.servicesClient;
  return write.value ? services.setPreference(write.key, write.user, write.domain, write.value)
                     : services.deletePreference(write.key, write.user, write.domain);
}

Attempts attemptAll(Platform& platform, const std::vector<PreferenceWrite>& writes, bool sync) {
  Attempts attempts;
  for (const PreferenceWrite& write : writes) {
    attempts.push_back({write, attempt(platform, write, sync)});
  }
  return attempts;
}

// The program's own domain is flushed with the record.
void flushDomains(Preferences& preferences, std::initializer_list<Attempts*> all) {
  std::map<std::string, WriteResult> flushed{{std::string(kProgramDomain), WriteResult::Written}};
  for (Attempts* attempts : all) {
    for (auto& [write, result] : *attempts) {
      if (write.owner != Owner::Program) continue;
      auto known = flushed.find(write.domain);
      if (known == flushed.end()) {
        const auto outcome = preferences.SMAPreferencesSynchronize(write.domain);
        known = flushed.emplace(write.domain, outcome).first;
      }
      result = known->second;
    }
  }
}

// The writes that the next run has to retry. Logs one line for each that was not done.
std::vector<PreferenceWrite> failuresOf(SystemLog& log, const Attempts& attempts,
                                        std::string_view what) {
  std::vector<PreferenceWrite> failures;
  for (const auto& [write, result] : attempts) {
    if (result) continue;
    log.repeated(LogLevel::Error, "tasking: entries not applied", "tasking: {} {} of {} {}",
                 write.domain, write.key, write.user,
                 result.isRefused()
                     ? fmt::format("is refused and not {}", what)
                     : fmt::format("could not be {}; the next run tries again", what));
    if (!result.isRefused()) failures.push_back(write);
  }
  return failures;
}

// Leaves in the change what remains to be done. True if a preference was set or removed.
bool carryOutWrites(Platform& platform, TaskingChange& change) {
  Attempts removals = attemptAll(platform, change.removals, /*sync=*/false);
  Attempts writes = attemptAll(platform, change.writes, /*sync=*/true);
  flushDomains(*platform.preferences, {&removals, &writes});
  const auto isDone = [](const Attempt& one) { return static_cast<bool>(one.result); };
  const bool hasEffect =
      std::ranges::any_of(removals, isDone) || std::ranges::any_of(writes, isDone);
  change.writes = failuresOf(*platform.log, writes, "set");
  // A later run must not remove what was set, or will be.
  std::set<PreferenceName> set;
  for (const auto& [write, result] : writes) {
    if (!result.isRefused()) set.insert(write.name());
  }
  std::erase_if(removals, [&](const Attempt& one) { return set.contains(one.write.name()); });
  change.removals = failuresOf(*platform.log, removals, "removed");
  return hasEffect;
}

// Writes the record of what is in force and removes the note, in one write of their file.
void recordOutcome(Preferences& record, const TaskingChange& change, bool isFinished) {
  if (!isFinished) {
    record.set(kUnfinished, unfinishedRecord(change));
    return;
  }
  if (change.payload) {
    record.set(kID, change.id);
    record.set(kSystem, change.system);
    record.set(kDigest, change.digest);
    record.set(kPayload, change.payload);
  }
  record.set(kUnfinished, nullptr);
}

struct Outcome {
  bool isFinished, isNews;
};

// The process may be killed between any two steps. So everything that is to be done is noted first,
// and a tasking that is about to be rolled back is no longer recorded as in force. A later run that
// finds the note carries out what it lists.
Outcome carryOutChange(Platform& platform, TaskingChange change, bool endsRecorded) {
  Preferences& record = *platform.preferences;
  record.set(kUnfinished, unfinishedRecord(change));
  if (endsRecorded) {
    for (const auto* known : {&kID, &kDigest, &kPayload}) record.set(*known, nullptr);
  }
  if (!flushRecord(record)) {
    platform.log->message(LogLevel::Error,
                          "tasking: nothing is changed, since it could not be noted first");
    return {false, false};
  }
  const bool hasEffect = carryOutWrites(platform, change);
  const bool isFinished = change.removals.empty() && change.writes.empty();
  recordOutcome(record, change, isFinished);
  if (!flushRecord(record)) {
    platform.log->message(LogLevel::Error,
                          "tasking: what was done is not recorded; the next run repeats it");
    return {false, hasEffect};
  }
  return {isFinished, hasEffect || isFinished};
}

}  // namespace

TaskingInputs readTaskingInputs(Platform& platform) {
  Preferences& preferences = *platform.preferences;
  TaskingInputs inputs;
  inputs.today = platform.metricsStore->TBDaysSince1970();
  if (const auto version = platform.deviceInformation->copySystemVersionDictionary()) {
    inputs.build = KvRef<KvString>::share(version->getAs<KvString>("ProductBuildVersion"));
  }
  inputs.lastUpdate = preferences.get(kLastUpdate);
  inputs.schedule = platform.systemConfiguration->getPreference(kSchedule.key, kSchedule.domain);
  inputs.recordedID = preferences.get(kID);
  inputs.recordedOS = preferences.get(kSystem);
  inputs.recordedPayload = preferences.get(kPayload);
  inputs.unfinished = preferences.get(kUnfinished);
  return inputs;
}

bool carryOut(Platform& platform, const TaskingPlan& plan) {
  for (const TaskingMessage& message : plan.messages) {
    platform.log->repeated(message.isFault ? LogLevel::Error : LogLevel::Default,
                           message.isFault ? "tasking: entries skipped" : "tasking: messages", "{}",
                           message.text);
  }
  if (plan.lastUpdate) platform.preferences->set(kLastUpdate, plan.lastUpdate);
  if (!plan.isDue) return true;
  const Outcome outcome =
      plan.change ? carryOutChange(platform, *plan.change, plan.endsRecorded) : Outcome{true, true};
  if (outcome.isNews) platform.notifications->postSystemNotification(kTaskingNotification);
  return outcome.isFinished;
}

void updateTaskingState(Platform& platform) {
  (void)carryOut(platform, planTasking(readTaskingInputs(platform)));
}

}  // namespace tally
