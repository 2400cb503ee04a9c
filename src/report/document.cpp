// The log document: its parts, its encoding and its hand-over to log submission.
#include <algorithm>
#include <string>
#include <string_view>

#include "base/utf8.h"
#include "kv/plist_codec.h"
#include "platform/platform.h"
#include "report/report.h"

namespace tally {
namespace {

constexpr std::int32_t kDocumentVersion = 1;
constexpr std::string_view kLastOSVersion = "LastOSVersion";
constexpr std::string_view kDiagnosticsSubsystem = "vellum.sysmetra.tallyd.tallyrun";

KvRef<KvObject> preferenceOr(std::string_view key, KvRef<KvObject> substitute) {
  auto value = platform().preferences->SMAPreferencesGetValue(key, kProgramDomain);
  return value ? value : substitute;
}

// A tasking may carry any value as its identifier or digest; the log carries text.
KvRef<KvObject> preferenceTextOr(std::string_view key, std::string_view substitute) {
  auto value = preferenceOr(key, KvString::create(substitute));
  if (value->type() == KvType::String) return value;
  return KvString::create(kvText(value.get()));
}

// The previous version when the system was updated since the last log, which is noted.
std::optional<std::string> noteOSVersion() {
  Preferences& preferences = *platform().preferences;
  const std::string current = platform().deviceInformation->SMAOSVersion();
  const auto last = preferences.SMAPreferencesGetValue(kLastOSVersion, kProgramDomain);
  const auto* text = kvCast<KvString>(last.get());
  if (text != nullptr && text->view() == current) return std::nullopt;
  preferences.SMAPreferencesSetValue(kLastOSVersion, KvString::create(current), kProgramDomain);
  preferences.SMAPreferencesSynchronize(kProgramDomain);
  return last ? kvText(last.get()) : "<unknown>";
}

std::optional<std::string> configurationNumber() {
  DeviceInformation& device = *platform().deviceInformation;
  if (!device.HasInternalDiagnostics(kDiagnosticsSubsystem)) return std::nullopt;
  const auto answer = device.DeviceQuery("ConfigNumber");
  const auto* data = kvCast<KvData>(answer.get());
  if (data == nullptr) return std::nullopt;
  std::string_view text(reinterpret_cast<const char*>(data->bytes().data()), data->bytes().size());
  text = text.substr(0, text.find('\0'));
  if (!isValidUtf8(text)) return std::nullopt;
  return std::string(text);
}

KvRef<KvDictionary> makeSubmissionOptions() {
  auto options = KvDictionary::create();
  if (const auto previous = noteOSVersion()) {
    options->set("previous_os_version", KvString::create(*previous));
  }
  if (const auto number = configurationNumber()) {
    options->set("ConfigNumber", KvString::create(*number));
  }
  return options;
}

}  // namespace

void TBReport::serializeWithDateAndAppInfo(std::int32_t day, const KvArray* appInfo) {
  if (_scalarsOutput->empty() && _distributionsOutput->empty() && _histogramsOutput->empty()) {
    return;
  }
  addInstalledAppInfo();
  addMetadataKeys();
  reportDatabaseSize();
  reportCPUUptime();
  reportVMStats();

  const auto encoded = encodeXmlPlist(*makeDocument(day, appInfo), kDailyLogMaximumBytes);
  if (!encoded) {
    logMessage(LogLevel::Error, "Could not create tallyd plist: {}", encoded.error().message);
    return;
  }
  const auto options = makeSubmissionOptions();
  const bool written = platform().logSubmission->SMAWriteLogForSubmission(
      kDailyLogTypeCode, kDailyLogName, options->empty() ? nullptr : options.get(), nullptr,
      [&encoded](LogFile& file) { file.write(*encoded); });
  if (!written) logMessage(LogLevel::Error, "Failed to write tallyd log");
}

KvRef<KvDictionary> TBReport::makeDocument(std::int32_t day, const KvArray* appInfo) {
  const std::string digest = _config ? _config->configFileDigest() : std::string();
  _config.reset();
  // The tasking in force, read in one go so that the three belong together.
  auto taskingID = preferenceTextOr("TaskingID", "(no tasking id)");
  auto taskingDigest = preferenceTextOr("TaskingDigest", "(no tasking digest)");
  auto taskingPayload = preferenceOr("TaskingPayload", KvArray::create());
  auto document = KvDictionary::create({
      {"TBCrashLogVersion", KvNumber::int32(kDocumentVersion)},
      {"TBStartDate", DayToDate(day)},
      {"TBLogCreationDate", KvDate::create(platform().clock->secondsSince1970())},
      {"TBMetadata", _metadataOutput},
      {"TBScalars", _scalarsOutput},
      {"TBDistributions", _distributionsOutput},
      {"TBDistributionsHistogram", _histogramsOutput},
      {"TBTasking", std::move(taskingPayload)},
      {"TBTaskID", std::move(taskingID)},
      {"TBTaskDigest", std::move(taskingDigest)},
      {"TBWhitelistDigest", KvString::create(digest)},
  });
  if (appInfo != nullptr) {
    document->set("TBActivatedAppInfo", KvRef<KvObject>::share(const_cast<KvArray*>(appInfo)));
  }
  return document;
}

}  // namespace tally
