#include "host/registry/matching.h"

#include <algorithm>

namespace tally {
namespace {

bool isText(const KvObject& wanted, std::string_view text) {
  const auto* string = kvCast<KvString>(&wanted);
  return string != nullptr && string->view() == text;
}

bool matchesClass(const RegistryEntry& entry, const KvObject& wanted) {
  return isText(wanted, entry.className);
}

bool matchesName(const RegistryEntry& entry, const KvObject& wanted) {
  return isText(wanted, entry.name);
}

bool matchesID(const RegistryEntry& entry, const KvObject& wanted) {
  const auto* number = kvCast<KvNumber>(&wanted);
  return number != nullptr && !number->isReal() && number->asUInt64() == entry.id;
}

bool matchesProperties(const RegistryEntry& entry, const KvObject& wanted) {
  const auto* properties = kvCast<KvDictionary>(&wanted);
  if (properties == nullptr) return false;
  return std::all_of(properties->begin(), properties->end(), [&entry](const auto& property) {
    const KvObject* present = entry.properties->get(property.key->view());
    if (present == nullptr) return false;
    // A wanted true asks whether there is such a property at all.
    const auto* boolean = kvCast<KvBoolean>(property.value.get());
    return (boolean != nullptr && boolean->value()) || kvEqual(present, property.value.get());
  });
}

constexpr struct {
  std::string_view key;
  bool (*matches)(const RegistryEntry&, const KvObject&);
} kRules[] = {{kMatchClass, matchesClass},
              {kMatchName, matchesName},
              {kMatchEntryID, matchesID},
              {kMatchProperty, matchesProperties}};

}  // namespace

bool entryMatches(const RegistryEntry& entry, const KvDictionary& matching) {
  return std::all_of(matching.begin(), matching.end(), [&entry](const auto& wanted) {
    const auto rule = std::find_if(std::begin(kRules), std::end(kRules),
                                   [&](const auto& row) { return row.key == wanted.key->view(); });
    return rule != std::end(kRules) && rule->matches(entry, *wanted.value);
  });
}

}  // namespace tally
