// The spool of submitted logs: NUMBER-NAME.log holds a log's body, NUMBER-NAME.info.plist what is
// known of it.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "host/spool/sequence_folder.h"
#include "host/spool/submission_consent.h"
#include "host/spool/submission_identity.h"
#include "platform/clock.h"
#include "platform/device_information.h"
#include "platform/log_submission.h"
#include "platform/notifications.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// The bounds of the folders of logs: the integer preferences "SpoolMaximumLogs" and
// "SpoolMaximumBytes" where they are above 0, else the defaults.
FolderBounds folderBounds(Preferences& preferences);

// Posted when a log is in the spool.
constexpr std::string_view kSubmittedNotification = "vellum.tallyd.tallyrun.submitted";

// Submits logs into a spool folder. A log is in the spool once its body has its final name, which
// is the last step; a killed run leaves only files that are ignored, which the next submission
// removes. Submissions of several processes are serialised. If the user forbids submission, a log
// is rejected with one info line.
class SpoolSubmission final : public LogSubmission {
 public:
  SpoolSubmission(DeviceDirectory folder, std::shared_ptr<SystemLog> log,
                  std::shared_ptr<Clock> clock, std::shared_ptr<Preferences> preferences,
                  std::shared_ptr<SubmissionConsent> consent,
                  std::shared_ptr<DeviceInformation> information,
                  std::shared_ptr<Notifications> notifications)
      : folder_(std::move(folder)),
        identityFile_(folder_.root()),
        log_(std::move(log)),
        clock_(std::move(clock)),
        preferences_(std::move(preferences)),
        consent_(std::move(consent)),
        information_(std::move(information)),
        notifications_(std::move(notifications)) {}
  bool SMAWriteLogForSubmission(std::string_view typeCode, std::string_view name,
                                const KvDictionary* options, const KvObject* reserved,
                                const Writer& writer) override;

 private:
  Status submit(std::string_view typeCode, std::string_view name, const KvDictionary* options,
                const Writer& writer);
  // The number's file, which may be null, is committed with the log; numbered is how that went.
  Status commit(const Directory& folder, const KvDictionary& information, const std::string& stem,
                const Writer& writer, std::uint64_t maximumBytes, TemporaryFile* number,
                Status& numbered);
  static Status writeFiles(const Directory& folder, const std::string& stem,
                           const std::string& info, const Writer& writer,
                           std::uint64_t maximumBytes, TemporaryFile* number, Status& numbered);

  DeviceDirectory folder_;
  IdentityFile identityFile_;
  std::shared_ptr<SystemLog> log_;
  std::shared_ptr<Clock> clock_;
  std::shared_ptr<Preferences> preferences_;
  std::shared_ptr<SubmissionConsent> consent_;
  std::shared_ptr<DeviceInformation> information_;
  std::shared_ptr<Notifications> notifications_;
  bool submitting_ = false;
};

// A log in the spool. Fields that its information lacks, or that have another type, are empty.
struct SpooledLog {
  std::uint64_t sequence = 0;
  std::uint64_t bytes = 0;  // of the body
  std::string fileName;     // of the body, in the spool's folder
  std::string typeCode, name;
  KvRef<KvDictionary> options;  // null when it was submitted without
  std::optional<double> creationTime;
  // The device's pseudonym, the log's number among those of its name on this device, and the
  // version of the system that submitted it.
  std::string device, systemVersion;
  std::optional<std::uint64_t> deviceSequence;
  std::optional<Error> fault;  // why its information cannot be read
};

// What a log's information says, in the fields that it is for; malformed information says nothing.
void readLogInformation(std::string_view bytes, SpooledLog& log);

// Names of a log's files: these after the same stem.
constexpr std::string_view kBodySuffix = ".log";
constexpr std::string_view kInformationSuffix = ".info.plist";
constexpr std::size_t kLargestInformation = 1u << 20;

// The logs of a folder, oldest first. Those that are held back are listed only if they are asked
// for.
enum class ListedLogs { Waiting, HeldToo };
Result<std::vector<SpooledLog>> listSpooled(const Directory& folder,
                                            ListedLogs which = ListedLogs::Waiting);

class SpoolReader {
 public:
  explicit SpoolReader(DeviceDirectory folder) : folder_(std::move(folder)) {}
  // Oldest first; a spool that is not there yet is empty.
  Result<std::vector<SpooledLog>> list() const;
  Result<std::string> readBody(const SpooledLog& log, std::size_t limit) const;

 private:
  DeviceDirectory folder_;
};

// Where the logs lie on a device.
DeviceDirectory spoolFolder(const DeviceRoot& root);

}  // namespace tally
