// The IPC endpoint on the message bus.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>

#include "host/bus/bus_connection.h"
#include "host/bus/event_loop.h"
#include "platform/ipc_endpoint.h"
#include "platform/system_log.h"

struct sd_bus_message;

namespace tally {

// The name is a name on the bus, an object and an interface with one method, Send(a{sv}), whose
// empty return acknowledges the message, whatever it contains; it is sent before the message is
// handled, so that no peer waits for a day's work. A message of another signature is acknowledged
// and ignored. One from a user who is not accepted, or above the limits, is refused: the peer gets
// a D-Bus error, the log a line, and it is not an event of the loop. Accepted are root, mobile and
// the program's own user; a sender that has disconnected by then is accepted only if the bus itself
// rejects all others.
class BusEndpoint final : public IpcEndpoint {
 public:
  BusEndpoint(std::shared_ptr<BusConnection> connection, std::shared_ptr<SdEventLoop> loop,
              std::shared_ptr<SystemLog> log)
      : connection_(std::move(connection)), loop_(std::move(loop)), log_(std::move(log)) {}
  ~BusEndpoint() override;
  BusEndpoint(const BusEndpoint&) = delete;
  BusEndpoint& operator=(const BusEndpoint&) = delete;

  bool listen(std::string_view name, MessageHandler handler) override;
  bool stopListening() override;

  // What the bus calls; for them alone. The result is 0 when the message is not for the endpoint, a
  // negative one an errno.
  int take(sd_bus_message* message);
  int look(sd_bus_message* message);

 private:
  Status start();
  void noteLostMessage();
  void listenAgain();
  bool isFromAcceptedSender(sd_bus_message* message);
  Status checkSender(sd_bus_message* message);
  Result<std::uint32_t> userOf(const char* sender);
  void accept(sd_bus_message* message);
  void refuse(sd_bus_message* message, const char* errorName, std::string_view kind,
              const std::string& reason);

  std::shared_ptr<BusConnection> connection_;
  std::shared_ptr<SdEventLoop> loop_;
  std::shared_ptr<SystemLog> log_;
  std::string name_;
  MessageHandler handler_;
  bool listening_ = false;
  bool arrived_ = false;  // a message, whatever became of it
  bool busRefusesOthers_ = false;
  std::set<std::uint32_t> acceptedUsers_;
  // Queries to the bus use a separate connection: on the main one, the answer would come after all
  // waiting messages, which would have to be read into memory first.
  BusConnection questions_;
  std::string lastSender_;  // the bus never reuses a name, so its user stays valid
  std::uint32_t lastUser_ = 0;
};

}  // namespace tally
