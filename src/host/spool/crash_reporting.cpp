#include "host/spool/crash_reporting.h"

#include "host/spool/log_spool.h"
#include "host/spool/waiting_logs.h"

namespace tally {

LinuxCrashReporting::LinuxCrashReporting(const DeviceRoot& root, std::shared_ptr<SystemLog> log,
                                         std::shared_ptr<Clock> clock,
                                         std::shared_ptr<Preferences> preferences,
                                         std::shared_ptr<SubmissionConsent> consent)
    : fixlineFolder_(root, "/var/mobile/Library/Logs/Fixline"),
      log_(std::move(log)),
      clock_(std::move(clock)),
      preferences_(std::move(preferences)),
      consent_(std::move(consent)),
      structuredData_(kStructuredDataLogs.on(root), *clock_, *log_) {}

bool LinuxCrashReporting::isDiagnosticSubmissionEnabled() { return consent_->given(); }

void LinuxCrashReporting::FDLogStructuredData(std::uint32_t recordType,
                                              const KvDictionary& record) {
  if (!consent_->permits("structured data")) return;
  const auto appended = structuredData_.append(recordType, record, folderBounds(*preferences_));
  if (!appended) {
    log_->fault(faultKind("structured data", appended.error()), "structured data of type {}: {}",
                recordType, appended.error().message);
  }
}

void LinuxCrashReporting::FDDumpAllOldStructuredDataLogs() {
  consent_->enforce();
  if (!consent_->given()) return;
  structuredData_.finishAll(folderBounds(*preferences_),
                            [this](const Error& error) { report("structured data", error); });
}

void LinuxCrashReporting::rollFixlineLogs() {
  if (const auto rolled = rollLogs(fixlineFolder_); !rolled) {
    report("repair-service logs", rolled.error());
  }
}

void LinuxCrashReporting::report(std::string_view what, const Error& error) const {
  log_->fault(faultKind(what, error), "{}: {}", what, error.message);
}

}  // namespace tally
