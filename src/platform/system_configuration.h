// Preferences of the system and of users other than the program's own.
#pragma once

#include <string_view>

#include "kv/value.h"
#include "platform/preferences.h"

namespace tally {

// The preferences of the system as a whole.
class SMASystemConfiguration {
 public:
  virtual ~SMASystemConfiguration() = default;
  // Null when the key is absent.
  virtual KvRef<KvObject> getPreference(std::string_view key, std::string_view domain) = 0;
  // A null value removes the key. With sync the write is durable when the call returns; without, it
  // is safe from the end of this process, however it ends, but perhaps not yet from a power cut.
  virtual WriteResult setPreference(std::string_view key, KvRef<KvObject> value,
                                    std::string_view domain, bool sync) = 0;
};

// Writes the preferences of a named user. A write is durable when the call returns.
class SMAServicesClient {
 public:
  virtual ~SMAServicesClient() = default;
  virtual WriteResult setPreference(std::string_view key, std::string_view user,
                                    std::string_view domain, KvRef<KvObject> value) = 0;
  virtual WriteResult deletePreference(std::string_view key, std::string_view user,
                                       std::string_view domain) = 0;
};

}  // namespace tally
