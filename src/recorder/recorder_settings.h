// The settings of the recorder.
#pragma once

#include <array>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "base/files/device_root.h"
#include "kv/value.h"
#include "platform/system_log.h"
#include "platform/tables/recorder_settings.h"

namespace tally {

// The number of a user of this machine; empty when there is none of that name.
using UserLookup = std::function<std::optional<std::int64_t>(std::string_view name)>;

struct RecorderSettings {
  RecorderSettings();

  std::int64_t number(RecorderNumber which) const {
    return numbers[static_cast<std::size_t>(which)];
  }

  struct Users {
    bool everybody = false;
    std::set<std::int64_t> numbers;
  };
  std::array<std::int64_t, std::size(kRecorderNumbers)> numbers;
  std::string prefix;
  std::map<std::string, std::string, std::less<>> rename;
  std::vector<std::string> tags, durable;
  std::map<std::string, Users, std::less<>> allow;  // by prefix of the key
  bool complete = true;  // false: a file could not be read, and with it perhaps what closes keys

  // Takes over what the dictionary sets; lists grow, everything else is replaced. What is malformed
  // is left out and named, with the file, in the log.
  void merge(const KvDictionary& dictionary, std::string_view file, const UserLookup& users,
             SystemLog& log);
};

// tallyd.plist and then, by name, the drop-ins tallyd.d/*.plist of the system's preferences, and
// after them those of the store's owner. While one of them cannot be read, only root may record
// keys that none of the others gives to somebody.
RecorderSettings readRecorderSettings(const DeviceRoot& root, const UserLookup& users,
                                      SystemLog& log);

}  // namespace tally
