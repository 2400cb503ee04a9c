#include "report/document.h"

#include <optional>
#include <string>
#include <vector>

#include "base/utf8.h"
#include "kv/plist_codec.h"
#include "kv/plist_xml_writer.h"
#include "platform/tables/known_preferences.h"

namespace tally {
namespace {

constexpr std::int32_t kDocumentVersion = 1;
constexpr const KnownPreference& kLastOSVersion = knownPreference("LastOSVersion");
constexpr std::string_view kMetadata = "TBMetadata";
// More than the keys and tags take that hold the values.
constexpr std::size_t kSectionTags = 1024;
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

// The document but for the day's values, which are written after the metadata.
KvRef<KvDictionary> makeFrame(Platform& platform, std::int32_t day, const std::string& digest,
                              const KvRef<KvDictionary>& metadata, const KvArray* appInfo) {
  // The tasking in force, read in one go so that the three belong together.
  Preferences& preferences = *platform.preferences;
  auto taskingID = preferenceTextOr(preferences, knownPreference("TaskingID"), "(no tasking id)");
  auto taskingDigest =
      preferenceTextOr(preferences, knownPreference("TaskingDigest"), "(no tasking digest)");
  auto taskingPayload =
      preferenceOr(preferences, knownPreference("TaskingPayload"), KvArray::create());
  auto frame = KvDictionary::create({
      {"TBCrashLogVersion", KvNumber::int32(kDocumentVersion)},
      {"TBStartDate", DayToDate(day)},
      {"TBLogCreationDate", KvDate::create(platform.clock->secondsSince1970())},
      {kMetadata, metadata},
      {"TBTasking", std::move(taskingPayload)},
      {"TBTaskID", std::move(taskingID)},
      {"TBTaskDigest", std::move(taskingDigest)},
      {"TBWhitelistDigest", KvString::create(digest)},
  });
  if (appInfo != nullptr) {
    frame->set("TBActivatedAppInfo", KvRef<KvObject>::share(const_cast<KvArray*>(appInfo)));
  }
  return frame;
}

// A dictionary under its key. write() writes the items, as long as all is well.
template <class Write>
Status writeDictionary(XmlPlistWriter& writer, std::string_view key, bool isEmpty,
                       const Write& write) {
  writer.key(key);
  if (isEmpty) return writer.emptyDictionary(), Done{};
  writer.beginDictionary();
  if (Status written = write(); !written) return written;
  writer.endDictionary();
  return Done{};
}

Status writeScalars(XmlPlistWriter& writer, const LoggedScalars& scalars) {
  Status written = Done{};
  scalars.each([&](std::string_view key, std::int64_t value) {
    writer.key(key);
    writer.integer(value);
    return !writer.isLarge() || (written = writer.passOn());
  });
  return written;
}

Status writeDistributions(XmlPlistWriter& writer, const LoggedDistributions& distributions) {
  for (const auto& [key, result] : distributions) {
    writer.key(key);
    if (Status written = writer.value(*result.summary.toArray()); !written) return written;
  }
  return Done{};
}

Status writeHistograms(XmlPlistWriter& writer, const LoggedDistributions& distributions) {
  for (const auto& [key, result] : distributions) {
    if (!result.histogram) continue;
    writer.key(key);
    if (Status written = writer.value(*result.histogram); !written) return written;
  }
  return Done{};
}

Status writeValues(XmlPlistWriter& writer, const LogValues& values) {
  const LoggedScalars& scalars = values.scalars();
  const LoggedDistributions& distributions = values.distributions();
  Status written = writeDictionary(writer, "TBScalars", scalars.empty(),
                                   [&] { return writeScalars(writer, scalars); });
  if (!written) return written;
  written = writeDictionary(writer, "TBDistributions", distributions.empty(),
                            [&] { return writeDistributions(writer, distributions); });
  if (!written) return written;
  return writeDictionary(writer, "TBDistributionsHistogram", !distributions.hasHistograms(),
                         [&] { return writeHistograms(writer, distributions); });
}

// The whole document, to where the writer passes it on.
Status writeDocument(XmlPlistWriter& writer, const KvDictionary& frame, const LogValues& values) {
  writer.beginDictionary();
  for (const auto& [key, part] : frame) {
    writer.key(key->view());
    if (Status written = writer.value(*part); !written) return written;
    if (key->view() != kMetadata) continue;
    if (Status written = writeValues(writer, values); !written) return written;
  }
  writer.endDictionary();
  const auto rest = writer.finish();
  return rest ? Status(Done{}) : rest.error();
}

// Whether the document can be written, before anything of it is. Values of the day are not nested,
// and of their size a bound is known, which few logs come near.
Status checkDocument(const KvDictionary& frame, const LogValues& values) {
  const auto encoded = encodeXmlPlist(frame, kDailyLogMaximumBytes);
  if (!encoded) return encoded.error();
  const std::size_t most =
      encoded->size() + values.scalars().mostBytes() + values.distributions().mostBytes();
  if (most <= kDailyLogMaximumBytes - kSectionTags) return Done{};
  XmlPlistWriter counter(kDailyLogMaximumBytes, [](std::string_view) { return true; });
  return writeDocument(counter, frame, values);
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

void submitLog(Platform& platform, std::int32_t day, LogValues& values,
               const KvRef<KvDictionary>& metadata, const KvArray* appInfo) {
  const std::string digest = values.releaseWhitelist();
  const auto frame = makeFrame(platform, day, digest, metadata, appInfo);
  if (const Status checked = checkDocument(*frame, values); !checked) {
    platform.log->message(LogLevel::Error, "Could not create tallyd plist: {}",
                          checked.error().message);
    return;
  }
  const auto options = makeSubmissionOptions(platform);
  const bool written = platform.logSubmission->SMAWriteLogForSubmission(
      kDailyLogTypeCode, kDailyLogName, options->empty() ? nullptr : options.get(), nullptr,
      [&](LogFile& file) {
        XmlPlistWriter writer(kDailyLogMaximumBytes,
                              [&file](std::string_view piece) { return file.write(piece); });
        if (const Status whole = writeDocument(writer, *frame, values); !whole) {
          file.abandon(whole.error());
        }
      });
  if (!written) platform.log->message(LogLevel::Error, "Failed to write tallyd log");
}

}  // namespace tally
