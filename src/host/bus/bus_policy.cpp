#include "host/bus/bus_policy.h"

#include <systemd/sd-bus.h>

#include <cstring>
#include <memory>

#include "host/bus/bus_connection.h"

namespace tally {
namespace {

// No method has this name, so a call that the bus passes is answered with an error and never
// handled.
constexpr const char* kProbe = "PolicyProbe";

struct SlotDeleter {
  void operator()(sd_bus_slot* slot) const { ::sd_bus_slot_unref(slot); }
};
using SlotHandle = std::unique_ptr<sd_bus_slot, SlotDeleter>;

int onAnswer(sd_bus_message* answer, void* refused, sd_bus_error*) {
  const char* const sender = ::sd_bus_message_get_sender(answer);
  *static_cast<bool*>(refused) =
      ::sd_bus_message_is_method_error(answer, SD_BUS_ERROR_ACCESS_DENIED) > 0 &&
      sender != nullptr && std::strcmp(sender, kBusDriver) == 0;
  return 1;
}

// Sends a call that must not start anything; `refused` is set when the bus's refusal arrives.
SlotHandle probe(sd_bus* asker, const std::string& name, const std::string& interface,
                 bool* refused) {
  sd_bus_message* made = nullptr;
  int result = ::sd_bus_message_new_method_call(
      asker, &made, name.c_str(), busObjectPath(name).c_str(), interface.c_str(), kProbe);
  const MessageHandle call(made);
  if (result >= 0) result = ::sd_bus_message_set_auto_start(call.get(), 0);
  sd_bus_slot* slot = nullptr;
  if (result >= 0) {
    result = ::sd_bus_call_async(asker, &slot, call.get(), onAnswer, refused, 0);
  }
  return SlotHandle(result >= 0 ? slot : nullptr);
}

}  // namespace

bool busRefusesOthers(sd_bus* asker, const std::string& name) {
  bool strangerRefused = false, memberRefused = false;
  const auto stranger = probe(asker, name, name + "." + kProbe, &strangerRefused);
  const auto member = probe(asker, name, name, &memberRefused);
  if (!stranger || !member) return false;
  // The bus serves a connection's messages in order, so its refusals arrive before this answer.
  const int result = ::sd_bus_call_method(asker, kBusDriver, kBusDriverObject, kBusDriver,
                                          kBusDriverQuestion, nullptr, nullptr, "");
  if (result < 0) return false;
  while (::sd_bus_process(asker, nullptr) > 0) {
  }
  return strangerRefused && !memberRefused;
}

}  // namespace tally
