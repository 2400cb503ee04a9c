// Names and order of the devices of a source.
#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "host/kernel/findings.h"
#include "host/tree/system_tree.h"

namespace tally {

// A device as it is found, before it is told apart from the others of its source.
struct DeviceCandidate {
  std::string directory;  // in /sys
  std::string name;       // as the kernel has it: untrusted, and others may have the same
  std::string busPath;    // where it is attached
  std::string identity = {};
  bool isSwept = true;
  std::string_view kind = {};
  bool isRemovable = false;
};

struct NamedDevice {
  std::string directory;
  FoundDevice device;
};

// Where the device of a directory in /sys is attached. The numbers that classes give their members
// have no part in it: "pci0000:00/0000:00:1d.0/0000:3d:00.0" of ".../nvme/nvme0/hwmon3". Empty if
// it is nowhere.
std::string busPathOf(const SystemTree& tree, const std::string& directory);

// In the order of their bus paths, each with a name of its own: the kernel's, with the bus path if
// others have it too, else with a number. The swept ones have ordinals: first those that are built
// in, then those that are plugged in.
std::vector<NamedDevice> named(std::vector<DeviceCandidate> devices);

// The same for texts that are in order already.
std::vector<std::string> uniqueNames(const std::vector<std::string>& names,
                                     const std::vector<std::string>& places);

// A name that can be part of a channel's: printable ASCII without blanks.
std::string channelWord(std::string_view text);

}  // namespace tally
