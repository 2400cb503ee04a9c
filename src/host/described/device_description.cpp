#include "host/described/device_description.h"

#include <fmt/core.h>

#include <cerrno>

#include "kv/plist_codec.h"

namespace tally {
namespace {

constexpr std::string_view kFileName = "device.plist";

}  // namespace

const KvObject* DeviceDescription::get(Described entry) {
  std::call_once(read_, [this] { read(); });
  const DescribedEntry& wanted = describedEntry(entry);
  const KvObject* const value = entries_ ? entries_->get(wanted.name) : nullptr;
  if (value == nullptr || value->type() == wanted.type) return value;
  reportEntry(entry, "is of the wrong type");
  return nullptr;
}

bool DeviceDescription::exists() {
  std::call_once(read_, [this] { read(); });
  return static_cast<bool>(entries_);
}

void DeviceDescription::read() {
  const auto report = [this](std::string_view fault) {
    log_->fault("device description: damaged", "device description {}/{}: {}", folder_.text(),
                kFileName, fault);
  };
  const auto document = folder_.readFile(kFileName, kPlistMaximumBytes);
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
  log_->fault(fmt::format("device description: entry \"{}\"", entry),
              "device description {}/{}: entry \"{}\" {}", folder_.text(), kFileName, entry, fault);
}

}  // namespace tally
