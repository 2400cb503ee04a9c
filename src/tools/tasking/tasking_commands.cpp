#include "tools/tasking/tasking_commands.h"

#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>

#include "base/files/file.h"
#include "driver/tasking.h"
#include "host/linux_platform.h"
#include "kv/plist_codec.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/command.h"
#include "tools/frame/table.h"
#include "tools/report/log_view.h"

namespace tally::tools {
namespace {

struct TaskingArguments {
  std::string file;
  bool dryRun = false;
};

std::size_t entriesOf(const KvObject* payload) {
  const auto* const array = kvCast<KvArray>(payload);
  return array != nullptr ? array->size() : 0;
}

// Removals, then writes.
std::vector<PreferenceWrite> writesOf(const TaskingPlan& plan) {
  if (!plan.change) return {};
  std::vector<PreferenceWrite> writes = plan.change->removals;
  writes.insert(writes.end(), plan.change->writes.begin(), plan.change->writes.end());
  return writes;
}

// What will be in force; null when there will be no tasking, or no other one.
const KvObject* recordedBy(const TaskingPlan& plan) {
  return plan.change && plan.change->payload ? plan.change->id.get() : nullptr;
}

bool hasFaults(const TaskingPlan& plan) {
  return std::ranges::any_of(plan.messages, &TaskingMessage::isFault);
}

Json planJson(const TaskingPlan& plan) {
  Json messages = Json::array();
  for (const TaskingMessage& message : plan.messages) {
    messages.push_back({{"fault", message.isFault}, {"text", message.text}});
  }
  Json writes = Json::array();
  for (const PreferenceWrite& write : writesOf(plan)) {
    Json one = {{"action", write.value ? "set" : "remove"},
                {"user", write.user},
                {"domain", write.domain},
                {"key", write.key}};
    if (write.value) one["value"] = jsonOf(write.value.get());
    writes.push_back(std::move(one));
  }
  return {{"messages", std::move(messages)},
          {"writes", std::move(writes)},
          {"records", jsonOf(recordedBy(plan))},
          {"notifies", plan.isDue}};
}

void printPlan(const ToolContext& context, const TaskingPlan& plan) {
  for (const TaskingMessage& message : plan.messages) {
    printLine(context, message.text, message.isFault ? Ink::Bad : Ink::Plain);
  }
  Table table({{""},
               {"user", Align::Left, true},
               {"domain", Align::Left, true},
               {"key", Align::Left, true},
               {"value", Align::Left, true}});
  for (const PreferenceWrite& write : writesOf(plan)) {
    table.add({write.value ? Cell("set", Ink::Good) : Cell("remove", Ink::Doubtful), write.user,
               write.domain, write.key, write.value ? valueText(write.value.get()) : ""});
  }
  if (table.empty()) {
    printLine(context, "nothing is written or removed");
  } else {
    table.print(context);
  }
  if (const KvObject* const recorded = recordedBy(plan)) {
    printLine(context, fmt::format("then {} is in force", valueText(recorded)));
  }
  if (plan.isDue) printLine(context, fmt::format("then {} is posted", kTaskingNotification));
}

Json taskingJson(const KvObject* id, const KvObject* digest, const KvObject* payload) {
  if (id == nullptr) return nullptr;
  return {{"id", jsonOf(id)}, {"digest", jsonOf(digest)}, {"payload", jsonOf(payload)}};
}

std::string taskingLine(const KvObject* id, const KvObject* digest, const KvObject* payload) {
  if (id == nullptr) return "none";
  return fmt::format("{}, digest {}, {}", valueText(id),
                     digest != nullptr ? valueText(digest) : "none",
                     counted(entriesOf(payload), "entry"));
}

int show(const ToolContext& context, const TaskingArguments&) {
  const TaskingInputs inputs = readTaskingInputs(*context.platform);
  const auto digest = context.platform->preferences->get(knownPreference("TaskingDigest"));
  const auto* const schedule = kvCast<KvDictionary>(inputs.schedule.get());
  const auto scheduled = [schedule](const char* key) {
    return schedule != nullptr ? schedule->get(key) : nullptr;
  };
  const TaskingPlan plan = planTasking(inputs);
  const KvObject* const id = inputs.recordedID.get();
  const KvObject* const payload = inputs.recordedPayload.get();
  if (context.json) {
    Json inForce = taskingJson(id, digest.get(), payload);
    if (id != nullptr) inForce["system"] = jsonOf(inputs.recordedOS.get());
    printJson(context,
              {{"inForce", std::move(inForce)},
               {"scheduled", taskingJson(scheduled("TaskingID"), scheduled("TaskingDigest"),
                                         scheduled("TaskingPayload"))},
               {"unfinished", static_cast<bool>(inputs.unfinished)},
               {"change", planJson(plan)}});
  } else {
    Table table({{""}, {"", Align::Left, true}});
    table.add({"in force", taskingLine(id, digest.get(), payload)});
    if (id != nullptr) table.add({"applied under", kvText(inputs.recordedOS.get())});
    table.add({"scheduled", taskingLine(scheduled("TaskingID"), scheduled("TaskingDigest"),
                                        scheduled("TaskingPayload"))});
    table.add({"system", kvText(inputs.build.get())});
    if (inputs.unfinished) table.add({"unfinished", "an update is not complete"});
    table.print(context);
    printHeading(context, "The next run");
    printPlan(context, plan);
  }
  return hasFaults(plan) ? kWrong : kSuccess;
}

int apply(const ToolContext& context, const TaskingArguments& arguments) {
  const auto document = readFile(arguments.file, kPlistMaximumBytes);
  if (!document) return complain(context, document.error().message, kWrong);
  auto schedule = decodePlist(*document);
  if (!schedule) {
    return complain(context, fmt::format("{}: {}", arguments.file, schedule.error().message),
                    kWrong);
  }
  const auto* const fields = kvCast<KvDictionary>(schedule->get());
  if (fields != nullptr && !fields->contains("TaskingID")) {
    return complain(context, fmt::format("{}: no \"TaskingID\"", arguments.file), kWrong);
  }
  // The platform of the tool only reads preferences; this command is one of the few that write.
  Platform variant = *context.platform;
  if (!arguments.dryRun) {
    Platform writing = makeLinuxPlatform(context.root, {variant.log, false});
    variant.preferences = writing.preferences;
    variant.systemConfiguration = writing.systemConfiguration;
    variant.servicesClient = writing.servicesClient;
  }
  std::unique_ptr<RunTurn> turn;
  if (!arguments.dryRun) turn = std::make_unique<RunTurn>(*variant.runLock);
  if (turn && !*turn) return kWrong;  // the lock has said so
  TaskingInputs inputs = readTaskingInputs(variant);
  inputs.schedule = *std::move(schedule);
  const TaskingPlan plan = planTasking(inputs);
  if (context.json) {
    printJson(context, planJson(plan));
  } else {
    printPlan(context, plan);
  }
  const bool done = arguments.dryRun || carryOut(variant, plan);
  return done && !hasFaults(plan) ? kSuccess : kWrong;
}

}  // namespace

void addTaskingCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<TaskingArguments> tasking(
      addFamily(app, "tasking", "Show and apply scheduled changes of preferences"), context);
  TaskingArguments& arguments = tasking.arguments();
  tasking.add("show", "Show the tasking in force, the schedule, and what would change", show);
  Command command =
      tasking.add("apply", "Apply a tasking from a file as if it were scheduled", apply);
  command.argument(kFileValue, &arguments.file,
                   "A property list: TaskingID, TaskingDigest and TaskingPayload");
  command.flag("--dry-run", &arguments.dryRun, "Only print each write and removal");
}

}  // namespace tally::tools
