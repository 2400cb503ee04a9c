// Finds the device root of the program that owns a name on the bus.
#pragma once

#include <string>
#include <string_view>

#include "base/result.h"

struct sd_bus;

namespace tally {

// The connection that owns the name; the bus starts the program if none does. For messages that
// must reach the program of this device root only: the machine has one such name, but any folder
// can be a root. An error if nothing owns the name, or if its owner serves another root.
Result<std::string> findEndpoint(sd_bus* bus, std::string_view name, const std::string& root);

}  // namespace tally
