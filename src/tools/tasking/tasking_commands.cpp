#include "tools/tasking/tasking_commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>

#include "base/file.h"
#include "driver/tasking.h"
#include "host/linux_platform.h"
#include "kv/plist_codec.h"
#include "platform/known_preferences.h"
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

// The writes of a plan as rows, its messages as lines.
class PlanView {
 public:
  explicit PlanView(const TaskingPlan& plan) : messages_(plan.messages), isDue_(plan.isDue) {
    if (!plan.change) return;
    for (const PreferenceWrite& removal : plan.change->removals) add(removal);
    for (const PreferenceWrite& write : plan.change->writes) add(write);
    if (plan.change->payload) recorded_ = plan.change->id;
  }
  bool hasFaults() const { return std::ranges::any_of(messages_, &TaskingMessage::isFault); }
  Json json() const {
    Json messages = Json::array();
    for (const TaskingMessage& message : messages_) {
      messages.push_back({{"fault", message.isFault}, {"text", message.text}});
    }
    return {{"messages", std::move(messages)},
            {"writes", writes_},
            {"records", jsonOf(recorded_.get())},
            {"notifies", isDue_}};
  }
  void print(const ToolContext& context) const {
    for (const TaskingMessage& message : messages_) {
      printLine(context, message.text, message.isFault ? Ink::Bad : Ink::Plain);
    }
    if (writes_.empty()) {
      printLine(context, "nothing is written or removed");
    } else {
      table_.print(context);
    }
    if (recorded_) {
      printLine(context, fmt::format("then {} is in force", valueText(recorded_.get())));
    }
    if (isDue_) {
      printLine(context, fmt::format("then {} is posted", kTaskingNotification));
    }
  }

 private:
  void add(const PreferenceWrite& write) {
    const bool removes = !write.value;
    table_.add({Cell(removes ? "remove" : "set", removes ? Ink::Doubtful : Ink::Good), write.user,
                write.domain, write.key, removes ? "" : valueText(write.value.get())});
    Json one = {{"action", removes ? "remove" : "set"},
                {"user", write.user},
                {"domain", write.domain},
                {"key", write.key}};
    if (!removes) one["value"] = jsonOf(write.value.get());
    writes_.push_back(std::move(one));
  }

  std::vector<TaskingMessage> messages_;
  KvRef<KvObject> recorded_;  // what will be in force; null: no tasking, or no other one
  bool isDue_;
  Json writes_ = Json::array();
  Table table_{{{""},
                {"user", Align::Left, true},
                {"domain", Align::Left, true},
                {"key", Align::Left, true},
                {"value", Align::Left, true}}};
};

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
  const PlanView plan(planTasking(inputs));
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
               {"change", plan.json()}});
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
    plan.print(context);
  }
  return plan.hasFaults() ? kWrong : kSuccess;
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
  const PlanView view(plan);
  if (context.json) {
    printJson(context, view.json());
  } else {
    view.print(context);
  }
  const bool done = arguments.dryRun || carryOut(variant, plan);
  return done && !view.hasFaults() ? kSuccess : kWrong;
}

}  // namespace

void addTaskingCommands(CLI::App& app, ToolContext& context) {
  const auto arguments = std::make_shared<TaskingArguments>();
  CLI::App* const family =
      app.add_subcommand("tasking", "Show and apply scheduled changes of preferences");
  family->require_subcommand(1);
  addCommand(family, context, "show", "The tasking in force, the schedule, and what would change",
             [&context, arguments] { return show(context, *arguments); });
  CLI::App* const command =
      addCommand(family, context, "apply", "Apply a tasking from a file as if it were scheduled",
                 [&context, arguments] { return apply(context, *arguments); });
  command
      ->add_option("FILE", arguments->file,
                   "A property list: TaskingID, TaskingDigest and TaskingPayload")
      ->required();
  command->add_flag("--dry-run", arguments->dryRun, "Only print each write and removal");
}

}  // namespace tally::tools
