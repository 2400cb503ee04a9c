// What `tallyctl doctor` finds for one part of the device.
#pragma once

#include <string>
#include <vector>

namespace tally::tools {

enum class Health {
  Ok,
  Missing,  // absent; the program works without it
  Wrong,    // present, but not as it should be
};

struct HealthCheck {
  Health health;
  std::string subject, text;
  std::string repair = {};  // a command line for a shell; empty: none is known
};
using HealthChecks = std::vector<HealthCheck>;

}  // namespace tally::tools
