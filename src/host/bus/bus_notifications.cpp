#include "host/bus/bus_notifications.h"

#include <systemd/sd-bus.h>

#include <cstring>

namespace tally {
namespace {

Status emit(BusConnection& connection, std::string_view name) {
  const auto [interface, member] = splitNotification(name);
  if (member.empty()) return Error{"not a name that a signal can have"};
  const auto bus = connection.get();
  if (!bus) return bus.error();
  int result =
      ::sd_bus_emit_signal(*bus, kNotificationObject, interface.c_str(), member.c_str(), nullptr);
  // It must be sent before work begins, during which the bus is not served.
  if (result >= 0) result = ::sd_bus_flush(*bus);
  if (result < 0) return Error{std::strerror(-result), -result};
  return Done{};
}

}  // namespace

void BusNotifications::postSystemNotification(std::string_view name) {
  if (const Status posted = emit(*connection_, name); !posted) {
    log_->fault(faultKind("notifications", posted.error()), "notification {} is not posted: {}",
                name, posted.error().message);
  }
}

void BusNotifications::offerSystemNotification(std::string_view name) {
  if (isOfMachine_ || connection_->existing() != nullptr) (void)emit(*connection_, name);
}

}  // namespace tally
