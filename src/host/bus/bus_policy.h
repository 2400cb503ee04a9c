// What the policy of the message bus says about an endpoint.
#pragma once

#include <string>

struct sd_bus;

namespace tally {

// True if the bus itself rejects messages to the name from users whom the policy does not allow, so
// that every message that arrives was allowed. Two calls test this. The shipped policy allows root
// one interface, on which a call must pass. On any other interface root is an ordinary user, whose
// call the bus must reject. The test fails if the policy is missing, overridden or not loaded.
// REQUIRES: this process owns the name, and `asker` is another connection of it to the same bus.
bool busRefusesOthers(sd_bus* asker, const std::string& name);

}  // namespace tally
