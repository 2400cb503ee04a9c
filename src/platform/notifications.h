// System notifications.
#pragma once

#include <string_view>

namespace tally {

class Notifications {
 public:
  virtual ~Notifications() = default;
  // Tells all subscribers that something happened; a notification consists of its name only. If it
  // cannot be posted, one line is logged.
  virtual void postSystemNotification(std::string_view name) = 0;
  // The same for one that nobody needs to receive, on a device that may have no way to post it:
  // then nothing happens.
  virtual void offerSystemNotification(std::string_view name) = 0;
};

}  // namespace tally
