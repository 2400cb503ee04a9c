#include "host/preferences/preference_services.h"

namespace tally {
namespace {

constexpr unsigned kSystemFileMode = 0644;
constexpr unsigned kUserFileMode = 0600;

}  // namespace

FileSystemConfiguration::FileSystemConfiguration(const DeviceRoot& root,
                                                 std::shared_ptr<SystemLog> log,
                                                 PropertyListPreferences::Access access)
    : preferences_(systemPreferencesFolder(root), std::move(log), kSystemFileMode, access) {}

KvRef<KvObject> FileSystemConfiguration::getPreference(std::string_view key,
                                                       std::string_view domain) {
  return preferences_.SMAPreferencesGetValue(key, domain);
}

WriteResult FileSystemConfiguration::setPreference(std::string_view key, KvRef<KvObject> value,
                                                   std::string_view domain, bool) {
  preferences_.SMAPreferencesSetValue(key, std::move(value), domain);
  return preferences_.SMAPreferencesSynchronize(domain);
}

WriteResult FileServicesClient::setPreference(std::string_view key, std::string_view user,
                                              std::string_view domain, KvRef<KvObject> value) {
  auto found = users_.find(user);
  if (found == users_.end()) {
    const auto folder = userPreferencesFolder(root_, user);
    if (!folder) {
      log_->fault("preferences: not a user's name", "preferences of {}: not a user's name", user);
      return WriteResult::Refused;
    }
    found = users_.try_emplace(std::string(user), *folder, log_, kUserFileMode, access_).first;
  }
  found->second.SMAPreferencesSetValue(key, std::move(value), domain);
  return found->second.SMAPreferencesSynchronize(domain);
}

WriteResult FileServicesClient::deletePreference(std::string_view key, std::string_view user,
                                                 std::string_view domain) {
  return setPreference(key, user, domain, nullptr);
}

}  // namespace tally
