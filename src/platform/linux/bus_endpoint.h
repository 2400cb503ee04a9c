// The IPC endpoint on the message bus.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "platform/ipc_endpoint.h"
#include "platform/linux/bus_connection.h"
#include "platform/linux/event_loop.h"
#include "platform/system_log.h"

struct sd_bus_message;

namespace tally {

// The name is a name on the bus, an object and an interface with one method, Send(a{sv}), whose
// empty return says that the message was taken, whatever it holds; it is sent before the message is
// handled, so that no peer waits for a day's work. What is not taken (another signature, a peer who
// is not heard, a message above the limits) costs one log line, and the peer gets a D-Bus error.
// Heard are root, mobile and the program's own user.
class BusEndpoint final : public IpcEndpoint {
 public:
  BusEndpoint(std::shared_ptr<BusConnection> connection, std::shared_ptr<SdEventLoop> loop,
              std::shared_ptr<SystemLog> log)
      : connection_(std::move(connection)), loop_(std::move(loop)), log_(std::move(log)) {}
  ~BusEndpoint() override;
  BusEndpoint(const BusEndpoint&) = delete;
  BusEndpoint& operator=(const BusEndpoint&) = delete;

  bool listen(std::string_view name, MessageHandler handler) override;
  void stopListening() override;

  // What the bus calls; for them alone. A negative result is an errno.
  int take(sd_bus_message* message);
  void look(sd_bus_message* message);

 private:
  Status start(const std::string& name);
  Status checkSender(sd_bus_message* message);
  Result<std::uint32_t> userOf(const char* sender);
  int refuse(sd_bus_message* message, const char* errorName, const std::string& reason);

  std::shared_ptr<BusConnection> connection_;
  std::shared_ptr<SdEventLoop> loop_;
  std::shared_ptr<SystemLog> log_;
  std::string name_;  // empty when there is no listener
  MessageHandler handler_;
  std::set<std::uint32_t> heardUsers_;
  // Questions about senders have a connection of their own: the answer on the main one would stand
  // behind all messages that wait there, which would have to be read into memory first.
  BusConnection questions_;
  std::string lastSender_;  // the bus never gives a sender's name again, so its user stays known
  std::uint32_t lastUser_ = 0;
};

}  // namespace tally
