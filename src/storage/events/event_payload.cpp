#include "storage/events/event_payload.h"

#include <nlohmann/json.hpp>

#include "storage/nand_info.h"

namespace tally {
namespace {

struct FilledField {
  std::string_view event, name;
  KvRef<KvObject> (*value)(const EventFigures& figures);
};
// The two disk fields carry each other's figure, as readers of the events expect.
constexpr FilledField kFilledFields[] = {
    {"vellum.massstorage.NANDInfo", "Error",
     [](const EventFigures& figures) {
       return GetStringFromDictionarySafe(*figures.info, kNANDInfoErrorKey);
     }},
    {"vellum.massstorage.NANDInfo_2", "ErrorMessage",
     [](const EventFigures& figures) {
       return GetStringFromDictionarySafe(*figures.info, kNANDInfoErrorMessageKey);
     }},
    {"vellum.massstorage.NANDInfo_2", "DiskUsageUserBlocksFree",
     [](const EventFigures& figures) -> KvRef<KvObject> {
       return KvNumber::int64(figures.capacityMiB);
     }},
    {"vellum.massstorage.NANDInfo_2", "DiskUsageUserTotalBlocks",
     [](const EventFigures& figures) -> KvRef<KvObject> {
       return KvNumber::int64(figures.availableMiB);
     }},
    {"vellum.massstorage.NANDInfo_6", "VMFreezer_NumPhysicalWrites",
     [](const EventFigures& figures) -> KvRef<KvObject> {
       return KvNumber::uint64(figures.freezerWrites);
     }},
};

}  // namespace

std::optional<EventReference> parseEventReference(std::string_view json) {
  const auto document = nlohmann::ordered_json::parse(json, nullptr, false);
  if (!document.is_object()) return std::nullopt;  // or not JSON
  EventReference reference;
  for (const auto& [event, fields] : document.items()) {
    if (!fields.is_object()) return std::nullopt;
    EventMapping& mapping = reference[event];
    mapping.reserve(fields.size());
    for (const auto& [name, key] : fields.items()) {
      const auto* const text = key.get_ptr<const std::string*>();
      if (text == nullptr) return std::nullopt;
      mapping.push_back({KvString::create(name), KvString::create(*text)});
    }
  }
  return reference;
}

KvRef<KvDictionary> buildEventPayload(std::string_view event, const EventMapping& mapping,
                                      const EventFigures& figures) {
  auto payload = KvDictionary::create(mapping.size());
  const KvRef<KvNumber> absent = KvNumber::int32(kZero);
  for (const EventField& field : mapping) {
    KvObject* const value = figures.info->get(field.key->view());
    payload->set(field.name, value != nullptr ? KvRef<KvObject>::share(value) : absent);
  }
  for (const FilledField& field : kFilledFields) {
    if (field.event == event) payload->set(field.name, field.value(figures));
  }
  return payload;
}

}  // namespace tally
