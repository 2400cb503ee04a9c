// Notifications as signals on the message bus.
#pragma once

#include <memory>

#include "host/bus/bus_connection.h"
#include "platform/notifications.h"
#include "platform/system_log.h"

namespace tally {

class BusNotifications final : public Notifications {
 public:
  BusNotifications(std::shared_ptr<BusConnection> connection, std::shared_ptr<SystemLog> log)
      : connection_(std::move(connection)), log_(std::move(log)) {}
  void postSystemNotification(std::string_view name) override;

 private:
  std::shared_ptr<BusConnection> connection_;
  std::shared_ptr<SystemLog> log_;
};

}  // namespace tally
