// The preference store of the program's own user.
#pragma once

#include <cstdint>
#include <string_view>

#include "kv/value.h"

namespace tally {

struct KnownPreference;  // platform/tables/known_preferences.h, which few need

// How a write ended. True when it is done.
class WriteResult {
 public:
  enum Kind {
    Written,
    Failed,   // this time: the same write may succeed later
    Refused,  // the store never takes such a write
  };
  constexpr WriteResult(Kind kind) : kind_(kind) {}
  constexpr explicit operator bool() const { return kind_ == Written; }
  constexpr bool isRefused() const { return kind_ == Refused; }

 private:
  Kind kind_;
};

// Values by key and domain. A key is any text, including the empty one. Writes are seen by later
// reads at once and reach storage at SMAPreferencesSynchronize of their domain, or when the program
// ends normally.
class Preferences {
 public:
  virtual ~Preferences() = default;
  // Null when the key is absent.
  virtual KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view domain) = 0;
  // A null value removes the key.
  virtual void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                                      std::string_view domain) = 0;
  // Makes the domain's writes durable, in one atomic replacement. The reason of a failure is logged
  // once until a write to the domain succeeds, and the writes are kept for the next attempt;
  // refused ones are dropped.
  virtual WriteResult SMAPreferencesSynchronize(std::string_view domain) = 0;

  // False while the domain's values exist but cannot be read; an absent key then means nothing.
  virtual bool isReadable(std::string_view) { return true; }

  // 0 when the key is absent or not a number.
  std::int32_t SMAPreferencesGetIntegerValue(std::string_view key, std::string_view domain);
  // False when the key is absent or neither a boolean nor a number; *exists (when given) tells
  // whether there is such a value.
  bool SMAPreferencesGetBoolValue(std::string_view key, std::string_view domain, bool* exists);

  // Null when it is absent.
  KvRef<KvObject> get(const KnownPreference& known);
  // A null value removes it.
  void set(const KnownPreference& known, KvRef<KvObject> value);
  // The number, or the row's fallback if the value is not a number, is outside the row's bound or,
  // for getReal(), is an integer.
  std::int64_t getInteger(const KnownPreference& known);
  double getReal(const KnownPreference& known);
};

}  // namespace tally
