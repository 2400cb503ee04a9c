// Notifications as signals on the message bus.
#pragma once

#include <memory>

#include "host/bus/bus_connection.h"
#include "platform/notifications.h"
#include "platform/system_log.h"

namespace tally {

class BusNotifications final : public Notifications {
 public:
  // isOfMachine: the bus is the device's own.
  BusNotifications(std::shared_ptr<BusConnection> connection, std::shared_ptr<SystemLog> log,
                   bool isOfMachine)
      : connection_(std::move(connection)), log_(std::move(log)), isOfMachine_(isOfMachine) {}
  void postSystemNotification(std::string_view name) override;
  // A run for a device in a folder of the machine opens no connection for this.
  void offerSystemNotification(std::string_view name) override;

 private:
  std::shared_ptr<BusConnection> connection_;
  std::shared_ptr<SystemLog> log_;
  bool isOfMachine_;
};

}  // namespace tally
