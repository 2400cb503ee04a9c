#include "host/bus/bus_connection.h"

#include <fmt/core.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "host/bus/bus_message.h"
#include "host/bus/bus_root.h"

namespace tally {
namespace {

// A run in progress answers only when it is done with the day.
constexpr std::uint64_t kAnswerMicroseconds = 10ull * 60 * 1'000'000;

}  // namespace

void BusDeleter::operator()(sd_bus* bus) const { ::sd_bus_flush_close_unref(bus); }

void MessageDeleter::operator()(sd_bus_message* message) const { ::sd_bus_message_unref(message); }

Result<BusHandle> openBus() {
  const bool system = ::geteuid() == 0;
  sd_bus* bus = nullptr;
  const int result = system ? ::sd_bus_open_system(&bus) : ::sd_bus_open_user(&bus);
  if (result < 0) {
    return Error{
        fmt::format("no {} bus: {}", system ? "system" : "session", std::strerror(-result)),
        -result};
  }
  return BusHandle(bus);
}

Result<sd_bus*> BusConnection::get() {
  if (bus_ == nullptr || ::sd_bus_is_open(bus_.get()) <= 0) {
    auto opened = openBus();
    if (!opened) return opened.error();
    bus_ = *std::move(opened);
  }
  return bus_.get();
}

std::string busObjectPath(std::string_view name) {
  std::string path = fmt::format("/{}", name);
  std::ranges::replace(path, '.', '/');
  return path;
}

std::pair<std::string, std::string> splitNotification(std::string_view name) {
  const std::size_t dot = name.rfind('.');
  if (dot == name.npos) return {};
  std::string interface(name.substr(0, dot)), member(name.substr(dot + 1));
  const bool valid = ::sd_bus_interface_name_is_valid(interface.c_str()) > 0 &&
                     ::sd_bus_member_name_is_valid(member.c_str()) > 0;
  if (!valid) return {};
  return {std::move(interface), std::move(member)};
}

Status sendToEndpoint(std::string_view name, const std::string& root, const KvDictionary& message) {
  const auto bus = openBus();
  if (!bus) return bus.error();
  const auto destination = findEndpoint(bus->get(), name, root);
  if (!destination) return destination.error();
  sd_bus_message* made = nullptr;
  int result = ::sd_bus_message_new_method_call(bus->get(), &made, destination->c_str(),
                                                busObjectPath(name).c_str(),
                                                std::string(name).c_str(), kBusMethod);
  const MessageHandle call(made);
  if (result < 0) return Error{std::strerror(-result), -result};
  if (Status content = appendBusDictionary(call.get(), message); !content) return content;
  sd_bus_error error{};
  result = ::sd_bus_call(bus->get(), call.get(), kAnswerMicroseconds, &error, nullptr);
  if (result >= 0) return Done{};
  Error reason{error.message != nullptr ? error.message : std::strerror(-result), -result};
  ::sd_bus_error_free(&error);
  return reason;
}

}  // namespace tally
