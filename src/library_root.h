// The device root that a caller in C names.
#pragma once

#include <string>

#include "base/files/device_root.h"
#include "base/result.h"
#include "host/system/environment.h"

namespace tally {

// Null stands for the environment's. An error when there is no such directory, or the path is
// empty.
inline Result<std::string> rootOfCaller(const char* root) {
  std::string path = root != nullptr ? root : deviceRootFromEnvironment();
  if (path.empty()) return Error{"the path of the device root is empty"};
  if (const auto opened = DeviceRoot(path).open("/"); !opened) return opened.error();
  return path;
}

}  // namespace tally
