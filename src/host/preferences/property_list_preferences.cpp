#include "host/preferences/property_list_preferences.h"

#include <fmt/core.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "base/files/file.h"
#include "base/files/set_aside.h"
#include "base/files/temporary_file.h"
#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kSuffix = ".plist";
constexpr std::string_view kLockName = ".preferences.lock";
// Damaged files that are kept for diagnosis.
constexpr std::uint32_t kDamagedFilesKept = 8;

std::string fileNameOf(std::string_view domain) { return fmt::format("{}{}", domain, kSuffix); }

}  // namespace

PropertyListPreferences::~PropertyListPreferences() {
  if (access_ == Access::ReadOnly) return;
  for (auto& [domain, state] : domains_) {
    if (!state.pending.empty()) writePending(state, domain);
  }
}

KvRef<KvObject> PropertyListPreferences::SMAPreferencesGetValue(std::string_view key,
                                                                std::string_view domain) {
  const std::lock_guard lock(mutex_);
  Domain* const state = find(domain);
  if (state == nullptr) return nullptr;
  if (const auto written = state->pending.find(key); written != state->pending.end()) {
    return written->second;
  }
  refresh(*state, domain);
  return KvRef<KvObject>::share(state->stored->get(key));
}

void PropertyListPreferences::SMAPreferencesSetValue(std::string_view key, KvRef<KvObject> value,
                                                     std::string_view domain) {
  const std::lock_guard lock(mutex_);
  if (Domain* const state = find(domain)) state->pending.insert_or_assign(std::string(key), value);
}

WriteResult PropertyListPreferences::SMAPreferencesSynchronize(std::string_view domain) {
  const std::lock_guard lock(mutex_);
  Domain* const state = find(domain);
  if (state == nullptr) return WriteResult::Refused;
  if (access_ == Access::ReadOnly || state->pending.empty()) return WriteResult::Written;
  return writePending(*state, domain);
}

KvRef<KvDictionary> PropertyListPreferences::copyDomain(std::string_view domain) {
  const std::lock_guard lock(mutex_);
  Domain* const state = find(domain);
  if (state == nullptr) return KvDictionary::create();
  refresh(*state, domain);
  auto all = state->stored->copy();
  for (const auto& [key, value] : state->pending) all->set(key, value);
  return all;
}

bool PropertyListPreferences::isReadable(std::string_view domain) {
  const std::lock_guard lock(mutex_);
  Domain* const state = find(domain);
  if (state == nullptr) return false;
  refresh(*state, domain);
  return state->read;
}

Result<std::vector<std::string>> PropertyListPreferences::listDomains() const {
  auto names = folder_.list();
  if (!names) return names;
  std::vector<std::string> domains;
  for (const std::string& name : *names) {
    if (name.ends_with(kSuffix)) domains.push_back(name.substr(0, name.size() - kSuffix.size()));
  }
  return domains;
}

PropertyListPreferences::Domain* PropertyListPreferences::find(std::string_view domain) {
  if (const auto known = domains_.find(domain); known != domains_.end()) return &known->second;
  // A name that looks like a temporary file's would be swept with them.
  if (!isSafeFileName(domain) || isTemporaryName(domain)) {
    report(domain, "not a name that a domain can have", "");
    return nullptr;
  }
  return &domains_.try_emplace(std::string(domain)).first->second;
}

// Compares the file's identity only, without resolving its path and reading it again.
void PropertyListPreferences::refresh(Domain& state, std::string_view domain) {
  if (state.read && opened_ && opened_->identity(fileNameOf(domain)) == state.identity) return;
  reload(state, domain, nullptr);
}

void PropertyListPreferences::reload(Domain& state, std::string_view domain,
                                     const Directory* locked) {
  const std::string name = fileNameOf(domain);
  auto folder = locked != nullptr ? Result<Directory>(*locked) : folder_.open();
  opened_ = folder ? std::optional(*folder) : std::nullopt;
  // Taken first: should the file be replaced meanwhile, the next look reads it again.
  const auto identity = folder ? folder->identity(name) : std::nullopt;
  const bool seen = state.read && identity == state.identity;
  state.read = true;
  state.identity = identity;
  const auto document =
      folder ? folder->readFile(name, kPlistMaximumBytes) : Result<std::string>(folder.error());
  if (document) {
    auto root = decodePlist(*document);
    auto* const dictionary = root ? kvCast<KvDictionary>(root->get()) : nullptr;
    if (dictionary == nullptr) {
      recover(state, domain, root ? "not a dictionary" : root.error().message, locked);
      return;
    }
    state.stored = KvRef<KvDictionary>::share(dictionary);
    state.writable = true;
    return;
  }
  const int code = document.error().systemError;
  const bool unusable = code == 0 || code == EFBIG;  // a folder in its place, or far too large
  if (unusable) {
    recover(state, domain, document.error().message, locked);
    return;
  }
  if (code == ENOENT) {
    state.stored = KvDictionary::create();
    state.writable = true;
    return;
  }
  // A file that cannot be read now may be sound, so it is not overwritten, and what was read from
  // this very file before still applies.
  if (std::exchange(state.writable, false))
    report(domain, "cannot be read", document.error().message);
  if (seen) return;
  state.stored = KvDictionary::create();
  state.read = false;  // the next use tries again
}

// Moves a damaged file out of the way of a new one.
void PropertyListPreferences::recover(Domain& state, std::string_view domain,
                                      const std::string& fault, const Directory* locked) {
  if (access_ == Access::ReadOnly) {
    state.stored = KvDictionary::create();
    report(domain, "damaged", fault);
    return;
  }
  if (locked == nullptr) {
    // Another process may be doing the same, or may just have put a sound file in its place.
    const auto folder = folder_.open();
    const auto lock = folder ? lockFolder(*folder) : Result<FileLock>(folder.error());
    if (lock) {
      reload(state, domain, &*folder);
      return;
    }
  }
  const bool wasWritable = state.writable;
  state.stored = KvDictionary::create();
  const auto moved =
      locked != nullptr ? moveAside(*locked, domain) : Status(Error{"its directory is not locked"});
  state.writable = static_cast<bool>(moved);
  if (moved) {
    report(domain, "damaged, set aside", fault);
    state.identity.reset();
  } else if (wasWritable) {
    report(domain, "damaged", fmt::format("{}; {}", fault, moved.error().message));
  }
}

Status PropertyListPreferences::moveAside(const Directory& folder, std::string_view domain) {
  const std::string name = fileNameOf(domain);
  const auto aside = setAside(folder, name, kDamagedWord, kDamagedFilesKept);
  if (aside) return Done{};
  // A file that is damaged again and again must not fill the volume.
  return aside.error().systemError == EEXIST ? folder.remove(name) : aside.error();
}

Result<FileLock> PropertyListPreferences::lockFolder(const Directory& folder) {
  auto lock = FileLock::acquire(folder, kLockName);
  if (lock && !std::exchange(swept_, true)) {
    // Nobody else is writing here, so temporary files are those of killed runs.
    if (const auto names = folder.list()) {
      for (const std::string& name : *names) {
        if (isTemporaryName(name)) (void)folder.remove(name);
      }
    }
  }
  return lock;
}

// True when the file, as it was last read, needs no change.
bool PropertyListPreferences::isStored(const Domain& state) {
  return state.read && state.writable &&
         std::all_of(state.pending.begin(), state.pending.end(), [&](const auto& change) {
           return kvIdentical(state.stored->get(change.first), change.second.get());
         });
}

WriteResult PropertyListPreferences::writePending(Domain& state, std::string_view domain) {
  // A removal of what is not there needs no right to write, and makes no directory. After a failure
  // the file may be the new one already, and yet not durable.
  refresh(state, domain);
  if (state.failing || !isStored(state)) {
    const auto folder = folder_.make();
    const auto lock = folder ? lockFolder(*folder) : Result<FileLock>(folder.error());
    if (!lock && !state.writable) return WriteResult::Failed;  // the line about reading says why
    if (!lock) return failed(state, domain, lock.error().message);
    reload(state, domain, &*folder);
    if (!state.writable) {
      return failed(state, domain, "what is there cannot be read");
    }
    const auto merged = state.stored->copy();
    for (const auto& [key, value] : state.pending) merged->set(key, value);
    const auto text = encodeXmlPlist(*merged);
    if (!text) {
      // Kept, they would fail every later write of the domain as well.
      state.pending.clear();
      report(domain, "not written", text.error().message);
      return WriteResult::Refused;
    }
    const std::string name = fileNameOf(domain);
    if (const Status written = writeFileAtomically(*folder, name, *text, mode_); !written) {
      return failed(state, domain, written.error().message);
    }
    state.stored = merged;
    state.identity = folder->identity(name);
  }
  state.pending.clear();
  state.failing = false;
  return WriteResult::Written;
}

WriteResult PropertyListPreferences::failed(Domain& state, std::string_view domain,
                                            const std::string& fault) const {
  if (!std::exchange(state.failing, true)) report(domain, "not written", fault);
  return WriteResult::Failed;
}

void PropertyListPreferences::report(std::string_view domain, std::string_view fault,
                                     std::string_view reason) const {
  log_->fault(fmt::format("preferences: {}", fault), "preferences {}: {}{}{}", domain, fault,
              reason.empty() ? "" : ": ", reason);
}

std::optional<DeviceDirectory> userPreferencesFolder(const DeviceRoot& root,
                                                     std::string_view user) {
  if (!isSafeFileName(user)) return std::nullopt;
  return DeviceDirectory(root, fmt::format("/var/{}/Library/Preferences", user));
}

DeviceDirectory systemPreferencesFolder(const DeviceRoot& root) {
  return {root, "/Library/Preferences"};
}

}  // namespace tally
