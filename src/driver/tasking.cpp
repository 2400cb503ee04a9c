#include "driver/tasking.h"

#include "platform/platform.h"
#include "report/report.h"

namespace tally {
namespace {

void carryOutStep(const PreferenceWrite& write) {
  switch (write.owner) {
    case PreferenceWrite::Owner::Program:
      platform().preferences->SMAPreferencesSetValue(write.key, write.value, write.domain);
      return;
    case PreferenceWrite::Owner::System: {
      const bool sync = static_cast<bool>(write.value);
      platform().systemConfiguration->setPreference(write.key, write.value, write.domain, sync);
      return;
    }
    case PreferenceWrite::Owner::User:
      if (write.value) {
        platform().servicesClient->setPreference(write.key, write.user, write.domain, write.value);
      } else {
        platform().servicesClient->deletePreference(write.key, write.user, write.domain);
      }
  }
}

void carryOutStep(const DomainFlush& flush) {
  platform().preferences->SMAPreferencesSynchronize(flush.domain);
}

void carryOutStep(const TaskingMessage& message) {
  logMessage(message.isFault ? LogLevel::Error : LogLevel::Default, "{}", message.text);
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
  inputs.unfinishedPayload = recorded("TaskingUnfinished");
  return inputs;
}

void carryOut(const TaskingPlan& plan) {
  for (const TaskingStep& step : plan.steps) {
    std::visit([](const auto& one) { carryOutStep(one); }, step);
  }
  if (plan.postsNotification) {
    platform().notifications->postSystemNotification(kTaskingNotification);
  }
}

void updateTaskingState() { carryOut(planTasking(readTaskingInputs())); }

}  // namespace tally
