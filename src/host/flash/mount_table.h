// The kernel's table of mounts: /proc/self/mountinfo.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace tally {

struct Mount {
  std::string device;                        // "259:2"; the kernel's own numbers begin with "0:"
  std::string point, type, source, options;  // the options of the file system
  bool hasBlockDevice() const { return !device.starts_with("0:"); }
};

// The mount that a path lies on; empty if the table has none. Of several at one place the last
// hides the others.
std::optional<Mount> mountOf(std::string_view table, std::string_view path);

// "ubi0" for the sources of volumes: "ubi0:data", "ubi0_1", "/dev/ubi0_1". Empty for others.
std::string ubiDeviceOf(std::string_view source);

// The value of an option such as "upperdir"; empty if it is not given.
std::string mountOption(std::string_view options, std::string_view name);

}  // namespace tally
