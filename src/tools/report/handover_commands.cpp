#include "tools/report/handover_commands.h"

#include <cerrno>
#include <chrono>
#include <filesystem>
#include <nlohmann/json.hpp>

#include "base/files/file_lock.h"
#include "base/process.h"
#include "host/spool/log_handover.h"
#include "host/spool/submitted_hooks.h"
#include "host/spool/waiting_logs.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr int kLongestLimit = 3600;

struct HandoverArguments {
  std::string to;
  std::optional<std::string> type;
  std::uint16_t limit = 120;
  bool reset = false;
};

std::function<bool()> consentOf(const ToolContext& context) {
  return [&context] { return context.platform->crashReporting->isDiagnosticSubmissionEnabled(); };
}

int complainOfAll(const ToolContext& context, const std::vector<std::string>& faults) {
  for (const std::string& fault : faults) complain(context, fault, kWrong);
  return faults.empty() ? kSuccess : kWrong;
}

int take(const ToolContext& context, const HandoverArguments& arguments) {
  std::error_code error;
  std::string to = std::filesystem::absolute(arguments.to, error).lexically_normal();
  if (error) return complain(context, "--to: " + error.message(), kWrong);
  to.resize(to.find_last_not_of('/') + 1);
  LogHandover handover(DeviceRoot(context.root), *context.platform->log,
                       folderBounds(*context.platform->preferences), consentOf(context));
  const auto taken = handover.take(to, arguments.type);
  if (!taken) return complain(context, taken.error().message, kWrong);
  if (context.json) {
    printJson(context, {{"taken", taken->names}, {"bytes", taken->bytes}});
  } else {
    printLine(context, fmt::format("{} ({}) moved to {}", counted(taken->names.size(), "log"),
                                   byteText(taken->bytes), to));
  }
  return complainOfAll(context, taken->faults);
}

int hooks(const ToolContext& context, const HandoverArguments& arguments) {
  if (isRoot()) {
    return complain(context,
                    "hooks are not run as root; run this as the user tallyrun-upload, as "
                    "tallyrun-upload.service does",
                    kWrong);
  }
  const DeviceRoot root(context.root);
  const auto opened = openHooks(root);
  if (!opened) return complain(context, opened.error().message, kWrong);
  const auto run =
      runHooks(root, *opened, std::chrono::seconds(arguments.limit), consentOf(context));
  if (!run) return complain(context, run.error().message, kWrong);
  if (context.json) {
    printJson(context,
              {{"hooks", opened->size()}, {"taken", run->done}, {"waiting", run->waiting}});
  } else {
    printLine(context, fmt::format("{}: {} taken, {} waiting", counted(opened->size(), "hook"),
                                   counted(run->done, "log"), run->waiting));
  }
  return complainOfAll(context, run->faults);
}

Result<SubmissionIdentity> resetIdentity(const DeviceRoot& root) {
  const auto spool = makePrivateFolder(spoolFolder(root));
  if (!spool) return spool.error();
  const auto lock = FileLock::acquire(*spool, kSubmittedLogs.lock);
  if (!lock) return lock.error();
  return IdentityFile(root).reset();
}

int pseudonym(const ToolContext& context, const HandoverArguments& arguments) {
  const DeviceRoot root(context.root);
  const auto identity = arguments.reset ? resetIdentity(root) : IdentityFile(root).read();
  const bool isMissing = !identity && identity.error().systemError == ENOENT;
  if (!identity && !isMissing) return complain(context, identity.error().message, kWrong);
  if (context.json) {
    Json last = Json::object();
    if (identity) {
      for (const auto& [name, number] : identity->last) last[name] = number;
    }
    printJson(context, {{"device", identity ? Json(identity->device) : Json(nullptr)},
                        {"lastSequenceNumbers", std::move(last)}});
    return kSuccess;
  }
  if (isMissing) {
    printLine(context, "the device has no pseudonym yet; the next submitted log gets one");
    return kSuccess;
  }
  printLine(context, identity->device, Ink::Strong);
  if (arguments.reset) {
    printLine(context,
              "From now on logs are submitted under this pseudonym and count from 1: a collector "
              "sees a new device. Logs that still wait keep the former pseudonym.");
  }
  for (const auto& [name, number] : identity->last) {
    printLine(context, fmt::format("{}: last number {}", name, number));
  }
  return kSuccess;
}

}  // namespace

void addHandoverCommands(CLI::App& report, ToolContext& context) {
  CommandGroup<HandoverArguments> group(report, context);
  HandoverArguments& arguments = group.arguments();
  Command taking = group.add("take", "Move submitted logs out of the spool, each once", take);
  taking
      .option("--to", {"DIR", ValueKind::Directory}, &arguments.to,
              "The directory; it is made if the one above it exists")
      .required();
  taking.option("--type", kTextValue, &arguments.type, "Only logs of this type code");
  group.add("hooks", "Run the hooks of /etc/tallyrun.d/submitted for each outgoing log", hooks)
      .option("--limit", {"SECONDS", ValueKind::Number}, &arguments.limit,
              "How long a hook may run for a log")
      .within(1, kLongestLimit)
      .showsDefault();
  group.add("pseudonym", "Show under which pseudonym logs are submitted", pseudonym)
      .flag("--reset", &arguments.reset, "Make a new one; the logs' numbers start at 1 again");
}

}  // namespace tally::tools
