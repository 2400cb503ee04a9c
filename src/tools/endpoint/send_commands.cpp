#include "tools/endpoint/send_commands.h"

#include <CLI/CLI.hpp>
#include <memory>
#include <nlohmann/json.hpp>

#include "driver/app_info_listener.h"
#include "host/bus/bus_connection.h"
#include "tools/endpoint/application_list.h"
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
  const auto arguments = std::make_shared<SendArguments>();
  CLI::App* const family = app.add_subcommand(
      "send", "Send a message to the program of this device root, which the bus starts if needed");
  family->require_subcommand(1);
  const auto add = [&](const char* name, const char* description, auto run) {
    return addCommand(family, context, name, description,
                      [&context, arguments, run] { return run(context, *arguments); });
  };
  add("logging", "Announce a list of activated applications", sendLogging);
  add("day", "Ask for the tasks of a day", sendDay)
      ->add_option("DAY", arguments->day, kDayForms)
      ->required();
  add("apps", "Deliver the list of activated applications", sendApplications)
      ->add_option("FILE", arguments->file,
                   "JSON or a property list, - for standard input: an array of objects with "
                   "bundle_id, version, adam_id, arch and uuid")
      ->required();
}

}  // namespace tally::tools
