#include "tools/store/forget_command.h"

#include <cerrno>
#include <chrono>
#include <iostream>
#include <memory>
#include <nlohmann/json.hpp>

#include "base/printable.h"
#include "host/ingress/recorder_client.h"
#include "host/linux_platform.h"
#include "host/spool/waiting_logs.h"
#include "host/store/store_aside.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

struct ForgetArguments {
  bool yes = false;
};

bool isConfirmed(const ToolContext& context, const WaitingFiles& waiting) {
  print(
      context.out,
      fmt::format("This erases the metrics store, {} ({}) that have not been uploaded, the "
                  "pseudonym of\nsubmitted logs, and what is remembered of processed days, on the "
                  "device {}. It cannot be undone. Type \"yes\" to go on: ",
                  counted(waiting.files, "file"), byteText(waiting.bytes), context.root));
  std::fflush(context.out);
  std::string answer;
  return std::getline(std::cin, answer) && answer == "yes";
}

// Those that were set aside too. Removes SQLite's companion files first, so that none is left for
// another store.
Status eraseStore(const DeviceRoot& root) {
  const StoreFile file = metricsStoreFile(root);
  const auto directory = file.directory.open();
  if (!directory && directory.error().systemError == ENOENT) return Done{};
  if (!directory) return directory.error();
  std::vector<std::string> names{file.name};
  for (const StoreSetAside& aside : storesSetAside(file)) names.push_back(aside.name);
  for (const std::string& name : names) {
    for (const char* const suffix : {"-journal", "-wal", "-shm", ""}) {
      if (auto removed = directory->remove(name + suffix); !removed) return removed;
    }
  }
  return directory->sync();
}

// What the recorder holds in memory would otherwise come into the next store.
Status eraseRecorded(const DeviceRoot& root) {
  constexpr std::chrono::seconds kPatience{70};  // it may be committing to a locked store
  const auto answer = askRecorder(root, "forget", kPatience);
  if (answer && *answer == "done\n") return Done{};
  if (answer) return Error{"the recorder: " + printable(*answer)};
  const int error = answer.error().systemError;
  if (error == ENOENT || error == ECONNREFUSED) return Done{};  // it holds nothing
  return Error{"the recorder: " + answer.error().message};
}

Status eraseHistory(Preferences& preferences) {
  for (const KnownPreference& known : kKnownPreferences) {
    if (known.isHistory) preferences.set(known, nullptr);
  }
  if (preferences.SMAPreferencesSynchronize(kProgramDomain)) return Done{};
  return Error{"the preferences could not be written"};
}

int forget(const ToolContext& context, const ForgetArguments& arguments) {
  const DeviceRoot root(context.root);
  const WaitingFiles waiting = countWaiting(root);
  if (!arguments.yes) {
    if (context.json || !terminalOf(0).interactive) {
      return complain(context, "--yes is required because standard input is not interactive",
                      kBadUsage);
    }
    if (!isConfirmed(context, waiting)) return complain(context, "nothing was erased", kWrong);
  }
  // The platform of the tool only reads preferences.
  const Platform writing = makeLinuxPlatform(root, {context.platform->log, false});
  const RunTurn turn(*writing.runLock);
  if (!turn) return kWrong;  // the lock has said why
  const Status recorded = eraseRecorded(root);
  const Status store = eraseStore(root);
  const auto logs = handleWaiting(root, WaitingAction::Erase);
  const Status history = eraseHistory(*writing.preferences);
  for (const Status& status :
       {recorded, store, logs ? Status(Done{}) : Status(logs.error()), history}) {
    if (!status) return complain(context, "not all was erased: " + status.error().message, kWrong);
  }
  if (context.json) {
    printJson(
        context,
        {{"erased", {{"store", true}, {"files", *logs}, {"pseudonym", true}, {"history", true}}}});
  } else {
    printLine(context,
              fmt::format("erased: the metrics store, {}, the pseudonym of submitted logs, the "
                          "history of processed days",
                          counted(*logs, "waiting file")));
  }
  return kSuccess;
}

}  // namespace

void addForgetCommand(CLI::App& app, ToolContext& context) {
  CommandGroup<ForgetArguments> group(app, context);
  group.add("forget", "Erase the metrics store, all waiting files, and the history", forget)
      .flag("--yes", &group.arguments().yes, "Do not ask");
}

}  // namespace tally::tools
