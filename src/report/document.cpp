#include "report/document.h"

#include <optional>
#include <string>
#include <vector>

#include "base/utf8.h"
#include "kv/plist_codec.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr std::int32_t kDocumentVersion = 1;
constexpr const KnownPreference& kLastOSVersion = knownPreference("LastOSVersion");
constexpr std::string_view kDiagnosticsSubsystem = "vellum.sysmetra.tallyd.tallyrun";

KvRef<KvObject> preferenceOr(Preferences& preferences, const KnownPreference& known,
                             KvRef<KvObject> substitute) {
  auto value = preferences.get(known);
  return value ? value : substitute;
}

// A tasking may carry any value as its identifier or digest; the log carries text.
KvRef<KvObject> preferenceTextOr(Preferences& preferences, const KnownPreference& known,
                                 std::string_view substitute) {
  auto value = preferenceOr(preferences, known, KvString::create(substitute));
  if (value->type() == KvType::String) return value;
  return KvString::create(kvText(value.get()));
}

// Notes the running version; returns the previous one if the system was updated since the last log.
std::optional<std::string> noteOSVersion(Platform& platform) {
  Preferences& preferences = *platform.preferences;
  const std::string current = platform.deviceInformation->SMAOSVersion();
  const auto last = preferences.get(kLastOSVersion);
  const auto* text = kvCast<KvString>(last.get());
  if (text != nullptr && text->view() == current) return std::nullopt;
  preferences.set(kLastOSVersion, KvString::create(current));
  preferences.SMAPreferencesSynchronize(kLastOSVersion.domain);
  return last ? kvText(last.get()) : "<unknown>";
}

std::optional<std::string> configurationNumber(DeviceInformation& device) {
  if (!device.HasInternalDiagnostics(kDiagnosticsSubsystem)) return std::nullopt;
  const auto answer = device.DeviceQuery("ConfigNumber");
  const auto* data = kvCast<KvData>(answer.get());
  if (data == nullptr) return std::nullopt;
  std::string_view text(reinterpret_cast<const char*>(data->bytes().data()), data->bytes().size());
  text = text.substr(0, text.find('\0'));
  if (!isValidUtf8(text)) return std::nullopt;
  return std::string(text);
}

KvRef<KvDictionary> makeSubmissionOptions(Platform& platform) {
  auto options = KvDictionary::create();
  if (const auto previous = noteOSVersion(platform)) {
    options->set("previous_os_version", KvString::create(*previous));
  }
  if (const auto number = configurationNumber(*platform.deviceInformation)) {
    options->set("ConfigNumber", KvString::create(*number));
  }
  return options;
}

}  // namespace

KvRef<KvDictionary> makeMetadata(Locale& locale) {
  auto metadata = KvDictionary::create();
  const auto preferred = locale.PreferredLanguages();
  const auto best = BestLocalizations(locale.SystemLanguages(), preferred);
  const auto setFirst = [&](std::string_view key, const std::vector<std::string>& languages) {
    metadata->set(key, KvString::create(languages.empty() ? "<unknown>" : languages.front()));
  };
  setFirst("TBUserInterfaceLanguage", best);
  setFirst("TBPreferredUserInterfaceLanguage", preferred);
  if (const auto region = locale.CurrentRegionCode()) {
    metadata->set("TBUserSetRegionFormat", KvString::create(*region));
  }
  return metadata;
}

KvRef<KvDictionary> makeDocument(Platform& platform, std::int32_t day, LogValues& values,
                                 const KvRef<KvDictionary>& metadata, const KvArray* appInfo) {
  const std::string digest = values.releaseWhitelist();
  // The tasking in force, read in one go so that the three belong together.
  Preferences& preferences = *platform.preferences;
  auto taskingID = preferenceTextOr(preferences, knownPreference("TaskingID"), "(no tasking id)");
  auto taskingDigest =
      preferenceTextOr(preferences, knownPreference("TaskingDigest"), "(no tasking digest)");
  auto taskingPayload =
      preferenceOr(preferences, knownPreference("TaskingPayload"), KvArray::create());
  auto document = KvDictionary::create({
      {"TBCrashLogVersion", KvNumber::int32(kDocumentVersion)},
      {"TBStartDate", DayToDate(day)},
      {"TBLogCreationDate", KvDate::create(platform.clock->secondsSince1970())},
      {"TBMetadata", metadata},
      {"TBScalars", values.scalars()},
      {"TBDistributions", values.distributions()},
      {"TBDistributionsHistogram", values.histograms()},
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

void submitDocument(Platform& platform, const KvDictionary& document) {
  const auto encoded = encodeXmlPlist(document, kDailyLogMaximumBytes);
  if (!encoded) {
    platform.log->message(LogLevel::Error, "Could not create tallyd plist: {}",
                          encoded.error().message);
    return;
  }
  const auto options = makeSubmissionOptions(platform);
  const bool written = platform.logSubmission->SMAWriteLogForSubmission(
      kDailyLogTypeCode, kDailyLogName, options->empty() ? nullptr : options.get(), nullptr,
      [&encoded](LogFile& file) { file.write(*encoded); });
  if (!written) platform.log->message(LogLevel::Error, "Failed to write tallyd log");
}

}  // namespace tally
