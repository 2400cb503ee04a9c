// What tallyctl says about stores that were set aside.
#pragma once

#include <string>

#include "base/files/device_root.h"

namespace tally::tools {

// How many there are, where, and how to get their rows back; empty when there are none.
std::string describeStoresAside(const DeviceRoot& root);

}  // namespace tally::tools
