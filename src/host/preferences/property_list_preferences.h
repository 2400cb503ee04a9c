// Preferences in property-list files, one per domain, in one directory.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "base/files/file_lock.h"
#include "platform/preferences.h"
#include "platform/system_log.h"

namespace tally {

// In the names of damaged files that are set aside (base/files/set_aside.h).
inline constexpr std::string_view kDamagedWord = "damaged";

// The preferences of whoever owns the directory: the program's own user, another user, the system.
// A domain is read at its first use and again whenever another process has replaced its file.
// Writes are kept per key and merged into the file's content when they are synchronised, so that
// two processes never undo each other's keys. Domains still unsynchronised are written when the
// object is destroyed. Values are shared, not copied: a value given or got must not be changed. Any
// thread may call.
class PropertyListPreferences final : public Preferences {
 public:
  // With ReadOnly no file is touched: a damaged one stays in its place, and what is written is
  // forgotten at the end.
  enum class Access { ReadWrite, ReadOnly };
  PropertyListPreferences(DeviceDirectory folder, std::shared_ptr<SystemLog> log,
                          unsigned mode = 0600, Access access = Access::ReadWrite)
      : folder_(std::move(folder)), log_(std::move(log)), mode_(mode), access_(access) {}
  ~PropertyListPreferences() override;
  PropertyListPreferences(const PropertyListPreferences&) = delete;
  PropertyListPreferences& operator=(const PropertyListPreferences&) = delete;

  KvRef<KvObject> SMAPreferencesGetValue(std::string_view key, std::string_view domain) override;
  void SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                              std::string_view domain) override;
  WriteResult SMAPreferencesSynchronize(std::string_view domain) override;
  bool isReadable(std::string_view domain) override;

  // All keys of a domain as they read now; empty when there are none.
  KvRef<KvDictionary> copyDomain(std::string_view domain);
  // The domains that have a file, sorted.
  Result<std::vector<std::string>> listDomains() const;

 private:
  struct Domain {
    KvRef<KvDictionary> stored = KvDictionary::create();  // what the file held when it was read
    std::map<std::string, KvRef<KvObject>, std::less<>> pending;  // null removes
    std::optional<FileIdentity> identity;                         // of the file that was read
    bool read = false;
    bool writable = true;  // false while the file holds something that could not be read
    bool failing = false;  // the last write failed, which was logged
  };

  Domain* find(std::string_view domain);
  void refresh(Domain& state, std::string_view domain);
  // In both, locked is the directory when this process holds its lock, else null.
  void reload(Domain& state, std::string_view domain, const Directory* locked);
  void recover(Domain& state, std::string_view domain, const std::string& fault,
               const Directory* locked);
  static Status moveAside(const Directory& folder, std::string_view domain);
  Result<FileLock> lockFolder(const Directory& folder);
  static bool isStored(const Domain& state);
  WriteResult writePending(Domain& state, std::string_view domain);
  WriteResult failed(Domain& state, std::string_view domain, const std::string& fault) const;
  // The reason may be empty.
  void report(std::string_view domain, std::string_view fault, std::string_view reason) const;

  DeviceDirectory folder_;
  std::shared_ptr<SystemLog> log_;
  unsigned mode_;
  Access access_;
  std::mutex mutex_;                 // of all below
  std::optional<Directory> opened_;  // as the last reload found it
  bool swept_ = false;
  std::map<std::string, Domain, std::less<>> domains_;
};

// The user whose preferences are the program's own.
constexpr std::string_view kProgramUser = "mobile";
// Where a user's preferences lie on a device; empty when the name cannot be a directory's.
std::optional<DeviceDirectory> userPreferencesFolder(const DeviceRoot& root, std::string_view user);
DeviceDirectory systemPreferencesFolder(const DeviceRoot& root);

}  // namespace tally
