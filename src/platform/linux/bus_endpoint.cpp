#include "platform/linux/bus_endpoint.h"

#include <fmt/format.h>
#include <pwd.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "base/printable.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/property_list_preferences.h"

namespace tally {
namespace {

int onSend(sd_bus_message* message, void* endpoint, sd_bus_error*) {
  return static_cast<BusEndpoint*>(endpoint)->take(message);
}

int onAnyMessage(sd_bus_message* message, void* endpoint, sd_bus_error*) {
  static_cast<BusEndpoint*>(endpoint)->look(message);
  return 0;  // whoever it is for gets it
}

// Access is checked here, by user, and not by the capabilities of the sender.
const sd_bus_vtable kMethods[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD(kBusMethod, kBusMethodSignature, "", onSend, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

Status statusOf(std::string_view step, int result) {
  if (result < 0) return Error{fmt::format("{}: {}", step, std::strerror(-result)), -result};
  return Done{};
}

}  // namespace

BusEndpoint::~BusEndpoint() {
  if (sd_bus* const bus = connection_->existing()) ::sd_bus_detach_event(bus);
}

bool BusEndpoint::listen(std::string_view name, MessageHandler handler) {
  handler_ = std::move(handler);
  heardUsers_ = {0, ::geteuid()};
  if (const auto* mobile = ::getpwnam(std::string(kProgramUser).c_str())) {
    heardUsers_.insert(mobile->pw_uid);
  }
  const Status started = start(std::string(name));
  if (started) {
    name_ = name;
  } else {
    log_->write(LogLevel::Error,
                fmt::format("endpoint {}: cannot listen: {}", name, started.error().message));
  }
  return static_cast<bool>(started);
}

Status BusEndpoint::start(const std::string& name) {
  const auto bus = connection_->get();
  if (!bus) return bus.error();
  sd_event* const loop = loop_->event();
  if (loop == nullptr) return Error{"no event loop"};
  Status status = statusOf("attach", ::sd_bus_attach_event(*bus, loop, SD_EVENT_PRIORITY_NORMAL));
  if (status) status = statusOf("filter", ::sd_bus_add_filter(*bus, nullptr, onAnyMessage, this));
  if (status) {
    status =
        statusOf("object", ::sd_bus_add_object_vtable(*bus, nullptr, busObjectPath(name).c_str(),
                                                      name.c_str(), kMethods, this));
  }
  // Last, for from here on messages come.
  if (status) status = statusOf("name", ::sd_bus_request_name(*bus, name.c_str(), 0));
  return status;
}

void BusEndpoint::stopListening() {
  if (name_.empty()) return;
  sd_bus* const bus = connection_->existing();
  ::sd_bus_release_name(bus, name_.c_str());
  // The answer stood behind all that had been sent to the name, which is now in the queue. What
  // comes later was not sent to it, and must not keep the program.
  std::uint64_t waiting = 0;
  ::sd_bus_get_n_queued_read(bus, &waiting);
  while (waiting > 0 && ::sd_bus_process(bus, nullptr) > 0)
    ::sd_bus_get_n_queued_read(bus, &waiting);
  name_.clear();
}

int BusEndpoint::take(sd_bus_message* message) {
  if (const Status heard = checkSender(message); !heard) {
    return refuse(message, SD_BUS_ERROR_ACCESS_DENIED, heard.error().message);
  }
  const auto dictionary = readBusDictionary(message);
  if (!dictionary) return refuse(message, SD_BUS_ERROR_LIMITS_EXCEEDED, dictionary.error().message);
  ::sd_bus_reply_method_return(message, nullptr);
  handler_(**dictionary);
  return 1;
}

// A call of another form is answered by the bus library; here it gets its line.
void BusEndpoint::look(sd_bus_message* message) {
  const char* const signature = ::sd_bus_message_get_signature(message, 1);
  if (::sd_bus_message_is_method_call(message, name_.c_str(), kBusMethod) > 0 &&
      signature != nullptr && std::strcmp(signature, kBusMethodSignature) != 0) {
    log_->write(LogLevel::Error,
                fmt::format("endpoint {}: a message is refused: not a dictionary but \"{}\"", name_,
                            printable(signature)));
  }
}

Status BusEndpoint::checkSender(sd_bus_message* message) {
  const char* const sender = ::sd_bus_message_get_sender(message);
  if (sender == nullptr) return Error{"it has no sender"};
  const auto user = userOf(sender);
  if (!user) return user.error();
  if (!heardUsers_.contains(*user)) return Error{fmt::format("user {} is not heard", *user)};
  return Done{};
}

Result<std::uint32_t> BusEndpoint::userOf(const char* sender) {
  if (lastSender_ == sender) return lastUser_;
  const auto bus = questions_.get();
  if (!bus) return bus.error();
  sd_bus_creds* credentials = nullptr;
  uid_t user = 0;
  int result = ::sd_bus_get_name_creds(*bus, sender, SD_BUS_CREDS_EUID, &credentials);
  if (result >= 0) result = ::sd_bus_creds_get_euid(credentials, &user);
  ::sd_bus_creds_unref(credentials);
  if (result == -ENXIO) return Error{"its sender did not wait until it was taken"};
  if (result < 0) {
    return Error{fmt::format("its sender cannot be told: {}", std::strerror(-result))};
  }
  lastSender_ = sender;
  lastUser_ = user;
  return lastUser_;
}

int BusEndpoint::refuse(sd_bus_message* message, const char* errorName, const std::string& reason) {
  log_->write(LogLevel::Error, fmt::format("endpoint {}: a message is refused: {}", name_, reason));
  ::sd_bus_reply_method_errorf(message, errorName, "%s", reason.c_str());
  return 1;
}

}  // namespace tally
