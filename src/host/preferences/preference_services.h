// Preferences of the system and of other users, in property-list files.
#pragma once

#include <map>
#include <memory>
#include <string>

#include "host/preferences/property_list_preferences.h"
#include "platform/system_configuration.h"

namespace tally {

// The system's preferences are a folder that everybody may read. Every write reaches its file at
// once, those without sync too: a removal that only this process knows of would be lost with it.
class FileSystemConfiguration final : public SMASystemConfiguration {
 public:
  FileSystemConfiguration(const DeviceRoot& root, std::shared_ptr<SystemLog> log,
                          PropertyListPreferences::Access access);
  KvRef<KvObject> getPreference(std::string_view key, std::string_view domain) override;
  WriteResult setPreference(std::string_view key, KvRef<KvObject> value, std::string_view domain,
                            bool sync) override;

 private:
  PropertyListPreferences preferences_;
};

class FileServicesClient final : public SMAServicesClient {
 public:
  FileServicesClient(DeviceRoot root, std::shared_ptr<SystemLog> log,
                     PropertyListPreferences::Access access)
      : root_(std::move(root)), log_(std::move(log)), access_(access) {}
  WriteResult setPreference(std::string_view key, std::string_view user, std::string_view domain,
                            KvRef<KvObject> value) override;
  WriteResult deletePreference(std::string_view key, std::string_view user,
                               std::string_view domain) override;

 private:
  DeviceRoot root_;
  std::shared_ptr<SystemLog> log_;
  PropertyListPreferences::Access access_;
  std::map<std::string, PropertyListPreferences, std::less<>> users_;
};

}  // namespace tally
