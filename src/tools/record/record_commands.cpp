#include "tools/record/record_commands.h"

#include <fmt/core.h>

#include <chrono>
#include <cmath>
#include <nlohmann/json.hpp>

#include "base/child_process.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"
#include "tools/record/record_lines.h"
#include "tools/record/record_words.h"
#include "tools/record/recorder_client.h"

namespace tally::tools {
namespace {

struct RecordArguments {
  std::string key;
  std::optional<std::string> amount;
  std::vector<std::string> values, command;
};

int failed(const ToolContext& context, const Error& error) {
  return complain(context, error.message, kWrong);
}

// Scripts call these often: they print nothing but faults.
int recordAll(const ToolContext& context, const char* verb, const RecordArguments& arguments) {
  auto client = RecorderClient::open(context.root);
  if (!client) return failed(context, client.error());
  std::vector<std::string> words = {verb, arguments.key};
  if (arguments.amount) words.push_back(*arguments.amount);
  words.insert(words.end(), arguments.values.begin(), arguments.values.end());
  const auto records = readRecords(*client, words);
  if (!records) return complain(context, records.error().message, kBadUsage);
  Status done = record(*client, *records);
  if (done) done = client->deliver();
  if (!done) return failed(context, done.error());
  if (context.json) printJson(context, {{"values", countValues(*records)}});
  return kSuccess;
}

int setGauges(const ToolContext& context, const RecordArguments& arguments) {
  return recordAll(context, "set", arguments);
}
int addToCounter(const ToolContext& context, const RecordArguments& arguments) {
  return recordAll(context, "add", arguments);
}
int pushSamples(const ToolContext& context, const RecordArguments& arguments) {
  return recordAll(context, "push", arguments);
}

std::string exitKey(const std::string& key, int status) {
  return fmt::format("{}.exit.{}", key, status);
}

// Whatever becomes of the record, the status is the command's: whoever put this before a command
// relies on it.
int timeCommand(const ToolContext& context, const RecordArguments& arguments) {
  auto client = RecorderClient::open(context.root);
  if (!client) return failed(context, client.error());
  constexpr int kLongestStatus = 255;
  if (!client->accepts(exitKey(arguments.key, kLongestStatus))) {
    return complain(context, kMetricKeyRule, kBadUsage);
  }
  const auto begin = std::chrono::steady_clock::now();
  const auto status = runInForeground(arguments.command);
  if (!status) {
    constexpr int kNotRunnable = 126, kNotFound = 127;
    complain(context, status.error().message, kWrong);
    return status.error().systemError == ENOENT ? kNotFound : kNotRunnable;
  }
  const std::chrono::duration<double, std::micro> taken = std::chrono::steady_clock::now() - begin;
  const double milliseconds = std::round(taken.count()) / 1000;
  Status done = client->push(arguments.key, std::span(&milliseconds, 1));
  if (done) done = client->add(exitKey(arguments.key, *status), 1);
  if (done) done = client->deliver();
  if (!done) complain(context, done.error().message, kWrong);
  if (*status != 0 && context.json) {
    complain(context, fmt::format("the command ended with status {}", *status), kWrong);
  }
  return *status;
}

int recordLines(const ToolContext& context, const RecordArguments&) {
  auto client = RecorderClient::open(context.root);
  if (!client) return failed(context, client.error());
  RecordedLines lines;
  const Status done = recordStandardInput(*client, lines);
  for (const auto& [line, reason] : lines.firstRejected) {
    complain(context, fmt::format("line {}: {}", line, reason), kWrong);
  }
  if (const auto more = lines.rejected - lines.firstRejected.size(); more > 0) {
    complain(context, fmt::format("and {} more", counted(more, "bad line")), kWrong);
  }
  if (context.json) {
    Json bad = Json::array();
    for (const auto& [line, reason] : lines.firstRejected) {
      bad.push_back({{"line", line}, {"reason", reason}});
    }
    printJson(context,
              {{"values", lines.values}, {"rejected", lines.rejected}, {"firstRejected", bad}});
  }
  if (!done) return failed(context, done.error());
  return lines.rejected == 0 ? kSuccess : kWrong;
}

}  // namespace

void addRecordCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<RecordArguments> record(
      addFamily(app, "record", "Record values of today through the metrics daemon, as any user"),
      context);
  RecordArguments& arguments = record.arguments();
  const auto add = [&](const char* name, const char* description, auto run) {
    const Command command = record.add(name, description, run);
    command.argument(
        kStoreKeyValue, &arguments.key,
        "Valid UTF-8 of 1 to 512 bytes, without control characters, colon, bar, hash or at sign");
    return command;
  };
  add("set", "Set scalars", setGauges)
      .argument({"VALUE", ValueKind::Number}, &arguments.values,
                "A 64-bit whole number; more keys may follow, each with its value");
  add("add", "Add to a scalar", addToCounter)
      .optionalArgument({"AMOUNT", ValueKind::Number}, &arguments.amount,
                        "A 64-bit whole number; 1 by default");
  add("push", "Add samples to a distribution", pushSamples)
      .argument({"VALUE", ValueKind::Number}, &arguments.values, "Finite numbers");
  const Command time =
      add("time", "Run a command, record its milliseconds and count its exit status", timeCommand);
  time.argument({"COMMAND", ValueKind::File}, &arguments.command,
                "The command with its arguments, to the end of the line: its milliseconds are "
                "samples of KEY, and KEY.exit.STATUS counts how it ended");
  time.endsWithCommandLine();
  record.add("lines", "Record the lines of standard input: set, add or push, a key, and values",
             recordLines);
}

}  // namespace tally::tools
