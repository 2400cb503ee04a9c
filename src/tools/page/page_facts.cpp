#include "tools/page/page_facts.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "base/time_text.h"
#include "kv/plist_codec.h"
#include "platform/platform.h"
#include "tools/report/log_view.h"

namespace tally::tools {
namespace {

struct KnownField {
  std::string_view key, name, meaning;
};
// In the order in which the page shows them.
constexpr KnownField kDocumentFields[] = {
    {"TBStartDate", "Day", "the day that the values are of"},
    {"TBLogCreationDate", "Created", "when the log was made"},
    {"TBTaskID", "Tasking", "the collection of settings that was last sent to this device"},
    {"TBTaskDigest", "Tasking digest", "tells that tasking from others"},
    {"TBTasking", "Tasking payload", "the settings themselves, as they were received"},
    {"TBWhitelistDigest", "Whitelist digest", "tells the whitelist in force from others"},
    {"TBCrashLogVersion", "Log version", "the form of the log"},
};
constexpr KnownField kMetadataFields[] = {
    {"TBUserInterfaceLanguage", "Language", "the language that the system shows you"},
    {"TBPreferredUserInterfaceLanguage", "Preferred language", "the first language that you chose"},
    {"TBUserSetRegionFormat", "Region", "the region whose formats you chose"},
};
constexpr KnownField kOptionFields[] = {
    {"previous_os_version", "Previous system version", "there since the system was updated"},
    {"ConfigNumber", "Configuration", "the model's configuration, on diagnostic builds alone"},
};
// Parts that are shown elsewhere.
constexpr std::string_view kParts[] = {"TBScalars", "TBDistributions", "TBDistributionsHistogram",
                                       "TBMetadata", "TBActivatedAppInfo"};
constexpr std::string_view kUnknown = "not known to this program";

std::string fieldText(const KvObject* value) {
  const bool isContainer = value->type() == KvType::Array || value->type() == KvType::Dictionary;
  if (!isContainer && value->type() != KvType::Data) return valueText(value);
  return jsonOf(value).dump(-1, ' ', false, Json::error_handler_t::replace);
}

void addFact(Json& facts, std::string_view name, std::string value, std::string_view meaning) {
  facts.push_back({name, std::move(value), meaning});
}

// The known fields, then the others of the dictionary, so that nothing that leaves is missing.
void addFields(Json& facts, const KvDictionary& fields, std::span<const KnownField> known) {
  for (const KnownField& field : known) {
    if (const KvObject* value = fields.get(field.key)) {
      addFact(facts, field.name, fieldText(value), field.meaning);
    }
  }
  for (const auto* entry : entriesByName(fields)) {
    const std::string_view key = entry->key->view();
    if (std::ranges::find(known, key, &KnownField::key) != known.end()) continue;
    if (known.data() == kDocumentFields && std::ranges::find(kParts, key) != std::end(kParts)) {
      continue;
    }
    addFact(facts, key, fieldText(entry->value.get()), kUnknown);
  }
}

// What is beside the body.
void addInformation(Json& facts, const PageSources& sources, const PageLog& log) {
  if (!log.spooled) {
    addFact(facts, "System version", sources.context.platform->deviceInformation->SMAOSVersion(),
            "goes with the log, beside its body");
    addFact(facts, "Device pseudonym", "added on submission",
            "a random name of this device, not made from its hardware; ties its logs together");
    addFact(facts, "Sequence number", "added on submission",
            "counts this device's logs, so that a lost one is noticed");
    return;
  }
  const SpooledLog& spooled = *log.spooled;
  addFact(facts, "File", spooled.fileName, "the log's name where it waits");
  addFact(facts, "Size", byteText(spooled.bytes), "of the log's body");
  addFact(facts, "System version", spooled.systemVersion.empty() ? "none" : spooled.systemVersion,
          "goes with the log, beside its body");
  addFact(facts, "Device pseudonym", spooled.device.empty() ? "none" : spooled.device,
          "a random name of this device, not made from its hardware; ties its logs together");
  addFact(facts, "Sequence number",
          spooled.deviceSequence ? std::to_string(*spooled.deviceSequence) : "none",
          "counts this device's logs, so that a lost one is noticed");
}

}  // namespace

Json pageFacts(const PageSources& sources, const PageLog& log) {
  Json facts = Json::array();
  if (log.content) {
    addFields(facts, log.content->metadata(), kMetadataFields);
    addFields(facts, log.content->document(), kDocumentFields);
  }
  addInformation(facts, sources, log);
  if (log.options) addFields(facts, *log.options, kOptionFields);
  return facts;
}

Json pageApplications(const DailyLog& log) {
  const auto* applications = log.document().getAs<KvArray>("TBActivatedAppInfo");
  if (applications == nullptr) return nullptr;
  Json rows = Json::array();
  for (const auto& item : *applications) {
    const auto* application = kvCast<KvDictionary>(item.get());
    Json row = Json::array();
    for (const char* field : {"bundle", "version", "adamID", "arch", "uuid"}) {
      const KvObject* value = application != nullptr ? application->get(field) : nullptr;
      row.push_back(value != nullptr ? kvText(value) : "");
    }
    rows.push_back(std::move(row));
  }
  return rows;
}

}  // namespace tally::tools
