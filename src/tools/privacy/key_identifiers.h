// Parts of a key's name that may identify a device, a network or a person.
#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/files.h"

namespace tally::tools {

// Names that the device itself has, in lower case.
struct DeviceNames {
  std::vector<std::string> users;  // of people, not of services
  std::string host;                // empty: not known
};
// From the device's etc/passwd and etc/hostname; what is missing is empty.
DeviceNames deviceNames(Files& files);

struct KeyIdentifier {
  std::string_view kind;  // "a hardware address"
  std::string_view part;  // of the key
};
// The first one; empty when there is none.
std::optional<KeyIdentifier> identifierIn(std::string_view key, const DeviceNames& names);

}  // namespace tally::tools
