// The typed reads that every preference store shares.
#include "platform/preferences.h"

#include <utility>

#include "platform/tables/known_preferences.h"

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

KvRef<KvObject> Preferences::get(const KnownPreference& known) {
  return SMAPreferencesGetValue(known.key, known.domain);
}

void Preferences::set(const KnownPreference& known, KvRef<KvObject> value) {
  SMAPreferencesSetValue(known.key, std::move(value), known.domain);
}

std::int64_t Preferences::getInteger(const KnownPreference& known) {
  const KvRef<KvObject> value = get(known);
  const auto* number = kvCast<KvNumber>(value.get());
  const std::int64_t integer = number != nullptr ? number->asInt64() : 0;
  const auto real = static_cast<double>(integer);
  const bool isAccepted = number != nullptr && real > known.bound.above && real < known.bound.below;
  return isAccepted ? integer : static_cast<std::int64_t>(known.bound.fallback);
}

double Preferences::getReal(const KnownPreference& known) {
  const KvRef<KvObject> value = get(known);
  const auto* number = kvCast<KvNumber>(value.get());
  const bool isReal = number != nullptr && number->isReal();
  const double real = isReal ? number->asDouble() : 0;
  const bool isAccepted = isReal && real > known.bound.above && real < known.bound.below;
  return isAccepted ? real : known.bound.fallback;
}

}  // namespace tally
