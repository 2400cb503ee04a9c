#include "host/bus/bus_endpoint.h"

#include <fmt/core.h>
#include <pwd.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "host/bus/bus_message.h"
#include "host/bus/bus_policy.h"
#include "host/preferences/property_list_preferences.h"
#include "host/system/environment.h"

namespace tally {
namespace {

int onSend(sd_bus_message* message, void* endpoint, sd_bus_error*) {
  return static_cast<BusEndpoint*>(endpoint)->take(message);
}

int onAnyMessage(sd_bus_message* message, void* endpoint, sd_bus_error*) {
  return static_cast<BusEndpoint*>(endpoint)->look(message);
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

// By the bus or by the service manager, which start the program like this only for a message.
bool isStartedForAMessage() {
  return !environmentVariable("DBUS_STARTER_ADDRESS").empty() ||
         environmentVariable("SYSTEMD_EXEC_PID") == std::to_string(::getpid());
}

}  // namespace

BusEndpoint::~BusEndpoint() {
  if (sd_bus* const bus = connection_->existing()) ::sd_bus_detach_event(bus);
}

bool BusEndpoint::listen(std::string_view name, MessageHandler handler) {
  name_ = name;
  handler_ = std::move(handler);
  acceptedUsers_ = {0, ::geteuid()};
  if (const auto* mobile = ::getpwnam(std::string(kProgramUser).c_str())) {
    acceptedUsers_.insert(mobile->pw_uid);
  }
  const Status started = start();
  listening_ = static_cast<bool>(started);
  if (!started) {
    log_->fault("endpoint: cannot listen", "endpoint {}: cannot listen: {}", name_,
                started.error().message);
  }
  return listening_;
}

Status BusEndpoint::start() {
  const auto bus = connection_->get();
  if (!bus) return bus.error();
  sd_event* const loop = loop_->event();
  if (loop == nullptr) return Error{"no event loop"};
  Status status = statusOf("attach", ::sd_bus_attach_event(*bus, loop, SD_EVENT_PRIORITY_NORMAL));
  if (status) status = statusOf("filter", ::sd_bus_add_filter(*bus, nullptr, onAnyMessage, this));
  if (status) {
    status =
        statusOf("object", ::sd_bus_add_object_vtable(*bus, nullptr, busObjectPath(name_).c_str(),
                                                      name_.c_str(), kMethods, this));
  }
  // Last, because messages arrive from here on.
  if (status) status = statusOf("name", ::sd_bus_request_name(*bus, name_.c_str(), 0));
  if (!status) return status;
  const auto asker = questions_.get();
  busRefusesOthers_ = asker && busRefusesOthers(*asker, name_);
  return status;
}

// A peer that had the bus start the program sends its message later, so the answer is known only
// when the listening ends.
void BusEndpoint::noteLostMessage() {
  if (arrived_ || !isStartedForAMessage()) return;
  // The bus drops the message that starts a program if its sender is gone by the time the program
  // has the name.
  log_->fault(
      "endpoint: lost message",
      "endpoint {}: the message that started this run is lost, since its sender did not wait "
      "until it was taken",
      name_);
}

bool BusEndpoint::stopListening() {
  if (!listening_) return false;
  sd_bus* const bus = connection_->existing();
  ::sd_bus_release_name(bus, name_.c_str());
  listening_ = false;
  // The answer came after all that had been sent to the name, which is now in the queue. What comes
  // later was not sent to it, and must not keep the program.
  std::uint64_t waiting = 0;
  ::sd_bus_get_n_queued_read(bus, &waiting);
  while (!listening_ && waiting > 0 && ::sd_bus_process(bus, nullptr) > 0)
    ::sd_bus_get_n_queued_read(bus, &waiting);
  if (!listening_) noteLostMessage();
  return listening_;
}

// A message that was sent before the name was released is about to be handled, and what its sender
// does next is meant for this process.
void BusEndpoint::listenAgain() {
  const int result = ::sd_bus_request_name(connection_->existing(), name_.c_str(), 0);
  listening_ = result >= 0;
  if (!listening_) {
    log_->fault("endpoint: cannot listen", "endpoint {}: cannot listen again: {}", name_,
                std::strerror(-result));
  }
}

int BusEndpoint::take(sd_bus_message* message) {
  if (!isFromAcceptedSender(message)) return 1;
  const auto dictionary = readBusDictionary(message);
  if (!dictionary) {
    refuse(message, SD_BUS_ERROR_LIMITS_EXCEEDED, "above the limits", dictionary.error().message);
    return 1;
  }
  accept(message);
  handler_(**dictionary);
  return 1;
}

// The bus library would answer a call of another form with an error.
int BusEndpoint::look(sd_bus_message* message) {
  if (::sd_bus_message_is_method_call(message, name_.c_str(), kBusMethod) <= 0) return 0;
  arrived_ = true;
  const char* const signature = ::sd_bus_message_get_signature(message, 1);
  const char* const path = ::sd_bus_message_get_path(message);
  const bool isDictionary =
      signature == nullptr || std::strcmp(signature, kBusMethodSignature) == 0;
  if (isDictionary || path == nullptr || path != busObjectPath(name_)) return 0;
  if (isFromAcceptedSender(message)) accept(message);
  return 1;
}

bool BusEndpoint::isFromAcceptedSender(sd_bus_message* message) {
  const Status checked = checkSender(message);
  if (!checked) {
    refuse(message, SD_BUS_ERROR_ACCESS_DENIED, "not from an accepted sender",
           checked.error().message);
  }
  return static_cast<bool>(checked);
}

Status BusEndpoint::checkSender(sd_bus_message* message) {
  const char* const sender = ::sd_bus_message_get_sender(message);
  if (sender == nullptr) return Error{"it has no sender"};
  const auto user = userOf(sender);
  if (user && acceptedUsers_.contains(*user)) return Done{};
  if (user) return Error{fmt::format("user {} is not accepted", *user)};
  const bool isGone = user.error().systemError == ENXIO;
  if (isGone && busRefusesOthers_) return Done{};
  return user.error();
}

Result<std::uint32_t> BusEndpoint::userOf(const char* sender) {
  if (lastSender_ == sender) return lastUser_;
  const auto bus = questions_.get();
  if (!bus) return Error{bus.error().message};
  sd_bus_creds* credentials = nullptr;
  uid_t user = 0;
  int result = ::sd_bus_get_name_creds(*bus, sender, SD_BUS_CREDS_EUID, &credentials);
  if (result >= 0) result = ::sd_bus_creds_get_euid(credentials, &user);
  ::sd_bus_creds_unref(credentials);
  if (result == -ENXIO) {
    return Error{"its sender did not wait until it was taken, and this bus lets anybody send",
                 ENXIO};
  }
  if (result < 0) {
    return Error{fmt::format("its sender cannot be identified: {}", std::strerror(-result))};
  }
  lastSender_ = sender;
  lastUser_ = user;
  return lastUser_;
}

void BusEndpoint::accept(sd_bus_message* message) {
  if (!listening_) listenAgain();
  loop_->noteHandledEvent();
  ::sd_bus_reply_method_return(message, nullptr);
}

void BusEndpoint::refuse(sd_bus_message* message, const char* errorName, std::string_view kind,
                         const std::string& reason) {
  log_->fault(fmt::format("endpoint: messages refused, {}", kind),
              "endpoint {}: a message is refused: {}", name_, reason);
  ::sd_bus_reply_method_errorf(message, errorName, "%s", reason.c_str());
}

}  // namespace tally
