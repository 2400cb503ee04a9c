// Connections to the message bus: the system bus for root, the session bus for any other user.
#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "base/result.h"
#include "kv/value.h"

struct sd_bus;
struct sd_bus_message;

namespace tally {

struct BusDeleter {
  // Sends what is still queued, so that nothing that was posted is lost with the process.
  void operator()(sd_bus* bus) const;
};
using BusHandle = std::unique_ptr<sd_bus, BusDeleter>;

struct MessageDeleter {
  void operator()(sd_bus_message* message) const;
};
using MessageHandle = std::unique_ptr<sd_bus_message, MessageDeleter>;

// A new connection; the error names the bus.
Result<BusHandle> openBus();

// The connection that the services of one platform share, made at its first use.
class BusConnection {
 public:
  // Borrowed. After a failure the next call tries again.
  Result<sd_bus*> get();
  // Null unless get() succeeded before.
  sd_bus* existing() const { return bus_.get(); }

 private:
  BusHandle bus_;
};

// The object of a name: "a.b" is at "/a/b".
std::string busObjectPath(std::string_view name);
// The interface and the member of a notification: all up to the last dot, and the rest. Both are
// empty when the name has no such form.
std::pair<std::string, std::string> splitNotification(std::string_view name);

constexpr const char* kBusMethod = "Send";
constexpr const char* kBusMethodSignature = "a{sv}";
// The bus itself, and a call that it always answers, after all earlier messages.
constexpr const char* kBusDriver = "org.freedesktop.DBus";
constexpr const char* kBusDriverObject = "/org/freedesktop/DBus";
constexpr const char* kBusDriverQuestion = "GetId";
// The object that emits notifications as signals.
constexpr const char* kNotificationObject = "/vellum";

// Sends one message to the endpoint of a name, which starts the program when it is not running, and
// waits until it is accepted. The error says why it was not, including that the program serves
// another device root.
Status sendToEndpoint(std::string_view name, const std::string& root, const KvDictionary& message);

}  // namespace tally
