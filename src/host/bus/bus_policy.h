// What the policy of the message bus says about an endpoint.
#pragma once

#include <string>

struct sd_bus;

namespace tally {

// True when the bus itself refuses messages to the name from users to whom the policy does not
// allow it, so that whatever reaches the name was allowed to. Found out by two calls: the shipped
// policy allows root one interface and everybody else nothing, so on any other interface root is an
// ordinary user, whose calls the bus must refuse, while it must pass those on the allowed one. A
// policy that is missing, overridden or not loaded fails this, whatever lies in which file.
// REQUIRES: this process owns the name, and `asker` is another connection of it to the same bus.
bool busRefusesOthers(sd_bus* asker, const std::string& name);

}  // namespace tally
