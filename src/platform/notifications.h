// System notifications.
#pragma once

#include <string_view>

namespace tally {

class Notifications {
 public:
  virtual ~Notifications() = default;
  // Tells whoever is interested that something happened; there is nothing to it but its name. A
  // notification that cannot be posted costs a log line.
  virtual void postSystemNotification(std::string_view name) = 0;
};

}  // namespace tally
