#include "tools/endpoint/send_commands.h"

#include <memory>
#include <nlohmann/json.hpp>

#include "driver/app_info_listener.h"
#include "host/bus/bus_connection.h"
#include "tools/endpoint/application_list.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

struct SendArguments {
  std::string day, file;
};

KvRef<KvDictionary> messageOf(Operation operation) {
  return KvDictionary::create({{"operation", KvNumber::int64(operation)}});
}

int send(const ToolContext& context, const KvDictionary& message, const std::string& what) {
  if (const Status sent = sendToEndpoint(kServiceName, context.root, message); !sent) {
    return complain(context, fmt::format("not sent: {}", sent.error().message), kWrong);
  }
  if (context.json) {
    printJson(context, {{"sent", what}});
  } else {
    printLine(context, fmt::format("sent to {}: {}", kServiceName, what));
  }
  return kSuccess;
}

int sendLogging(const ToolContext& context, const SendArguments&) {
  return send(context, *messageOf(kLoggingStatus), "logging status");
}

int sendDay(const ToolContext& context, const SendArguments& arguments) {
  const auto day = dayOf(context, arguments.day);
  if (!day) return kBadUsage;
  const auto message = messageOf(kRunDay);
  message->set("value", KvNumber::int64(*day));
  return send(context, *message, fmt::format("the tasks of {}", dayName(*day)));
}

int sendApplications(const ToolContext& context, const SendArguments& arguments) {
  const auto list = readApplicationList(arguments.file);
  if (!list) return complain(context, list.error().message, kWrong);
  const auto message = messageOf(kAppData);
  message->set("app_data", *list);
  return send(context, *message, counted((*list)->size(), "application"));
}

}  // namespace

void addSendCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<SendArguments> send(
      addFamily(
          app, "send",
          "Send a message to the program of this device root, which the bus starts if needed"),
      context);
  SendArguments& arguments = send.arguments();
  send.add("logging", "Announce a list of activated applications", sendLogging);
  send.add("day", "Ask for the tasks of a day", sendDay)
      .argument(kDayValue, &arguments.day, kDayForms);
  send.add("apps", "Deliver the list of activated applications", sendApplications)
      .argument(kFileValue, &arguments.file,
                "JSON or a property list, - for standard input: an array of objects with "
                "bundle_id, version, adam_id, arch and uuid");
}

}  // namespace tally::tools
