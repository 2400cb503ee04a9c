// The typed reads that every preference store shares.
#include "platform/preferences.h"

namespace tally {

std::int32_t Preferences::SMAPreferencesGetIntegerValue(std::string_view key,
                                                        std::string_view domain) {
  const KvRef<KvObject> value = SMAPreferencesGetValue(key, domain);
  const auto* number = kvCast<KvNumber>(value.get());
  return number != nullptr ? number->asInt32() : 0;
}

bool Preferences::SMAPreferencesGetBoolValue(std::string_view key, std::string_view domain,
                                             bool* exists) {
  const KvRef<KvObject> value = SMAPreferencesGetValue(key, domain);
  const auto* boolean = kvCast<KvBoolean>(value.get());
  const auto* number = kvCast<KvNumber>(value.get());
  if (exists != nullptr) *exists = boolean != nullptr || number != nullptr;
  if (boolean != nullptr) return boolean->value();
  return number != nullptr && number->asDouble() != 0.0;
}

}  // namespace tally
