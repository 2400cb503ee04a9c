// The crash-reporting service on files.
#pragma once

#include <memory>
#include <string>

#include "host/spool/structured_data.h"
#include "host/spool/submission_consent.h"
#include "platform/crash_reporting.h"
#include "platform/preferences.h"

namespace tally {

class LinuxCrashReporting final : public CrashReporting {
 public:
  LinuxCrashReporting(const DeviceRoot& root, std::shared_ptr<SystemLog> log,
                      std::shared_ptr<Clock> clock, std::shared_ptr<Preferences> preferences,
                      std::shared_ptr<SubmissionConsent> consent);
  bool isDiagnosticSubmissionEnabled() override;
  void FDLogStructuredData(std::uint32_t recordType, const KvDictionary& record) override;
  void FDDumpAllOldStructuredDataLogs() override;
  void rollFixlineLogs() override;

 private:
  void report(std::string_view what, const Error& error) const;

  DeviceDirectory fixlineFolder_;
  std::shared_ptr<SystemLog> log_;
  std::shared_ptr<Clock> clock_;
  std::shared_ptr<Preferences> preferences_;
  std::shared_ptr<SubmissionConsent> consent_;
  StructuredDataFolder structuredData_;
};

}  // namespace tally
