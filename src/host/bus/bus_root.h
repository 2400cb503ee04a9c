// Which device root the program serves that has a name on the bus.
#pragma once

#include <string>
#include <string_view>

#include "base/result.h"

struct sd_bus;

namespace tally {

// The connection that owns the name, started by the bus when there is none, for messages that must
// reach the program of this device root and no other: a name on the bus is the machine's, a root is
// any folder. An error when nothing owns it, or when its program serves another root.
Result<std::string> findEndpoint(sd_bus* bus, std::string_view name, const std::string& root);

}  // namespace tally
