// The device description: device/device.plist under the device root, whose entries override what
// Linux would answer.
#pragma once

#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <type_traits>

#include "base/files/device_root.h"
#include "host/described/described_entries.h"
#include "kv/value.h"
#include "platform/system_log.h"

namespace tally {

// Read once, at the first question. A damaged file is named in one error line and answers nothing;
// an entry of the wrong type is named in one error line and ignored. Any thread may ask.
class DeviceDescription {
 public:
  // The directory of device.plist and of the files that it names.
  DeviceDescription(DeviceDirectory folder, std::shared_ptr<SystemLog> log)
      : folder_(std::move(folder)), log_(std::move(log)) {}

  // Whether there is a description that can be read.
  bool exists();
  // Borrowed; null when it is not described or of another type.
  template <class T>
  const T* getAs(std::type_identity_t<DescribedAs<T>> entry) {
    return static_cast<const T*>(get(entry.entry));
  }
  // Logs one error that an entry, or its named part, cannot be used.
  void reportEntry(std::string_view entry, std::string_view fault);
  void reportEntry(Described entry, std::string_view fault) {
    reportEntry(describedEntry(entry).name, fault);
  }

 private:
  const KvObject* get(Described entry);
  void read();

  DeviceDirectory folder_;
  std::shared_ptr<SystemLog> log_;
  std::once_flag read_;
  KvRef<KvDictionary> entries_;
};

}  // namespace tally
