#include "platform/linux/device_description.h"

#include <fmt/format.h>

#include <cerrno>

#include "base/file.h"
#include "kv/plist_codec.h"

namespace tally {

const KvObject* DeviceDescription::get(std::string_view key) {
  std::call_once(read_, [this] { read(); });
  return entries_ ? entries_->get(key) : nullptr;
}

void DeviceDescription::read() {
  const auto report = [this](std::string_view fault) {
    log_->write(LogLevel::Error, fmt::format("device description {}: {}", path_, fault));
  };
  const auto document = readFile(path_, kPlistMaximumBytes);
  if (!document) {
    if (document.error().systemError != ENOENT) report(document.error().message);
    return;
  }
  const auto root = decodePlist(*document);
  if (!root) {
    report(root.error().message);
    return;
  }
  entries_ = KvRef<KvDictionary>::share(kvCast<KvDictionary>(root->get()));
  if (!entries_) report("not a dictionary");
}

void DeviceDescription::reportEntry(std::string_view entry, std::string_view fault) {
  const std::lock_guard lock(reporting_);
  if (!reported_.emplace(entry).second) return;
  log_->write(LogLevel::Error,
              fmt::format("device description {}: entry \"{}\" {}", path_, entry, fault));
}

}  // namespace tally
