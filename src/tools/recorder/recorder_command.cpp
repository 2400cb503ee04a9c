#include "tools/recorder/recorder_command.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <map>
#include <nlohmann/json.hpp>
#include <optional>
#include <thread>
#include <vector>

#include "base/time_text.h"
#include "host/ingress/recorder_client.h"
#include "host/system/machine/machine.h"
#include "kv/plist_codec.h"
#include "platform/recording/ingress.h"
#include "recorder/refusal.h"
#include "tools/frame/command.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"

namespace tally::tools {
namespace {

struct RecorderArguments {
  bool watch = false, commit = false;
};

// What the recorder says about itself, from one moment.
class RecorderMoment {
 public:
  explicit RecorderMoment(KvRef<KvDictionary> fields) : fields_(std::move(fields)) {}

  const KvDictionary& fields() const { return *fields_; }
  std::int64_t number(std::string_view name) const { return numberIn(*fields_, name); }
  std::optional<double> real(std::string_view name) const { return fields_->getDouble(name); }
  static std::int64_t numberIn(const KvDictionary& fields, std::string_view name) {
    return fields.getInt64(name).value_or(0);
  }
  std::vector<const KvDictionary*> users() const {
    std::vector<const KvDictionary*> rows;
    const auto* const array = fields_->getAs<KvArray>("users");
    for (std::size_t i = 0; array != nullptr && i < array->size(); ++i) {
      if (const auto* row = array->getAs<KvDictionary>(i)) rows.push_back(row);
    }
    return rows;
  }
  // The metrics of the user so far.
  std::int64_t metricsOf(std::int64_t user) const {
    for (const KvDictionary* row : users()) {
      if (numberIn(*row, "user") == user) return numberIn(*row, "metrics");
    }
    return 0;
  }

 private:
  KvRef<KvDictionary> fields_;
};

std::optional<RecorderMoment> askForMoment(const ToolContext& context) {
  constexpr std::chrono::seconds kLongestWait{5};
  const auto answer = askRecorder(DeviceRoot(context.root), "status", kLongestWait);
  if (!answer) {
    const int error = answer.error().systemError;
    complain(context,
             error == ENOENT || error == ECONNREFUSED
                 ? "no recorder is running; it starts with the first metric where its sockets are "
                   "served (tallyctl doctor)"
                 : answer.error().message,
             kWrong);
    return std::nullopt;
  }
  auto value = decodePlist(*answer);
  auto* const fields = value ? kvCast<KvDictionary>(value->get()) : nullptr;
  if (fields == nullptr) {
    complain(context, "the recorder's answer is not understood", kWrong);
    return std::nullopt;
  }
  return RecorderMoment(KvRef<KvDictionary>::share(fields));
}

std::string userText(std::int64_t user) {
  if (user == Sender::kOthers) return "others";
  return user == Sender::kAnonymous ? "anonymous (UDP)" : userName(user);
}

std::string durationText(double seconds) {
  constexpr double kSecondsPerMinute = 60;
  return seconds < kSecondsPerMinute ? fmt::format("{:.0f} s", seconds)
                                     : fmt::format("{:.0f} min", seconds / kSecondsPerMinute);
}

// Per second since the former moment, or since the start.
std::string rateText(const RecorderMoment& now, const std::optional<RecorderMoment>& before,
                     std::int64_t count, std::int64_t countBefore) {
  const double seconds =
      now.real("seconds").value_or(0) - (before ? before->real("seconds").value_or(0) : 0);
  if (!(seconds > 0)) return "";
  return realText(static_cast<double>(count - countBefore) / seconds);
}

void printSummary(const ToolContext& context, const RecorderMoment& now,
                  const std::optional<RecorderMoment>& before) {
  printHeading(context, "Recorder");
  std::string held = fmt::format("holds {} of {} in {} of {}",
                                 counted(std::uint64_t(now.number("samples_held")), "sample"),
                                 counted(std::uint64_t(now.number("keys")), "key"),
                                 byteText(std::uint64_t(now.number("bytes_held"))),
                                 byteText(std::uint64_t(now.number("bytes_limit"))));
  if (const auto since = now.real("held_seconds")) {
    held += fmt::format("; the oldest change waits for {}", durationText(*since));
  }
  printLine(context, held);
  printLine(context, fmt::format("{} metrics, {} a second; running for {}",
                                 integerText(now.number("metrics")),
                                 rateText(now, before, now.number("metrics"),
                                          before ? before->number("metrics") : 0),
                                 durationText(now.real("seconds").value_or(0))));
  std::string commits = counted(std::uint64_t(now.number("commits")), "commit");
  if (const auto last = now.real("last_commit")) {
    commits += ", the last at " + dateAndTimeText(*last);
  }
  printLine(context, commits);
  if (!now.fields().contains("day")) {
    printLine(context, "the clock is not set: what is recorded is dated once it is", Ink::Doubtful);
  }
  if (const auto failure = now.fields().getString("failure")) {
    printLine(context, "the last commit failed: " + std::string(*failure), Ink::Bad);
  }
}

void printUsers(const ToolContext& context, const RecorderMoment& now,
                const std::optional<RecorderMoment>& before) {
  Table table({{"user"},
               {"metrics", Align::Right},
               {"a second", Align::Right},
               {"keys today", Align::Right},
               {"memory", Align::Right},
               {"refused", Align::Left, /*shrinks=*/true}});
  for (const KvDictionary* row : now.users()) {
    const std::int64_t user = RecorderMoment::numberIn(*row, "user");
    const std::int64_t metrics = RecorderMoment::numberIn(*row, "metrics");
    std::string refused;
    if (const auto* counts = row->getAs<KvDictionary>("refused")) {
      for (const auto& [name, count] : *counts) {
        const auto* const number = kvCast<KvNumber>(count.get());
        if (number == nullptr) continue;
        if (!refused.empty()) refused += ", ";
        refused += std::string(name->view()) + " " + integerText(number->asInt64());
      }
    }
    table.add({userText(user), integerText(metrics),
               rateText(now, before, metrics, before ? before->metricsOf(user) : 0),
               integerText(RecorderMoment::numberIn(*row, "keys")),
               byteText(std::uint64_t(RecorderMoment::numberIn(*row, "bytes"))),
               Cell(refused, refused.empty() ? Ink::Plain : Ink::Doubtful)});
  }
  if (table.empty()) return;
  printHeading(context, "By user, since the recorder's start");
  table.print(context);
}

template <class Rows>
void addCounts(Table& table, const RecorderMoment& now, std::string_view field, const Rows& rows) {
  const auto* const counts = now.fields().getAs<KvDictionary>(field);
  if (counts == nullptr) return;
  for (const RefusalRow& row : rows) {
    const std::int64_t count = RecorderMoment::numberIn(*counts, row.name);
    if (count != 0) table.add({integerText(count), row.name.data(), row.meaning.data()});
  }
}

void printCounts(const ToolContext& context, const RecorderMoment& now) {
  Table table({{"", Align::Right}, {""}, {"", Align::Left, /*shrinks=*/true}});
  addCounts(table, now, "refused", kRefusals);
  addCounts(table, now, "counts", kRecorderCounts);
  if (table.empty()) return;
  printHeading(context, "Refused, or not as it was sent");
  table.print(context);
}

void printRefusedKeys(const ToolContext& context, const RecorderMoment& now) {
  constexpr std::size_t kMostShown = 10;
  Table table({{"", Align::Right}, {""}, {"", Align::Left, /*shrinks=*/true}});
  const auto* const rows = now.fields().getAs<KvArray>("refused_keys");
  for (std::size_t i = 0; rows != nullptr && i < std::min(rows->size(), kMostShown); ++i) {
    const auto* const row = rows->getAs<KvDictionary>(i);
    if (row == nullptr) continue;
    table.add({integerText(RecorderMoment::numberIn(*row, "count")),
               std::string(row->getString("reason").value_or("")),
               std::string(row->getString("key").value_or(""))});
  }
  if (table.empty()) return;
  printHeading(context, "Keys that were refused last");
  table.print(context);
}

void show(const ToolContext& context, const RecorderMoment& now,
          const std::optional<RecorderMoment>& before) {
  if (context.json) {
    Json document = jsonOf(&now.fields());
    if (!before) return printJson(context, document);
    return print(context.out, printableJson(document.dump()) + "\n");  // a line for each moment
  }
  printSummary(context, now, before);
  printUsers(context, now, before);
  printCounts(context, now);
  printRefusedKeys(context, now);
}

int commitNow(const ToolContext& context) {
  constexpr std::chrono::seconds kLongestCommit{130};  // two turns at a store that is locked
  const auto committed = SocketRecorderLink(DeviceRoot(context.root)).commit(kLongestCommit);
  if (!committed) return complain(context, committed.error().message, kWrong);
  if (context.json) {
    printJson(context, {{"committed", *committed}});
  } else {
    printLine(context, *committed ? "committed" : "no recorder is running, so nothing is held");
  }
  return kSuccess;
}

int run(const ToolContext& context, const RecorderArguments& arguments) {
  if (arguments.commit) return commitNow(context);
  std::optional<RecorderMoment> before;
  for (;;) {
    auto now = askForMoment(context);
    if (!now) return kWrong;
    if (arguments.watch && context.output.escapes) print(context.out, "\x1b[H\x1b[2J");
    show(context, *now, before);
    if (!arguments.watch) return kSuccess;
    std::fflush(context.out);
    if (std::ferror(context.out) != 0) return kWrong;
    before = std::move(now);
    std::this_thread::sleep_for(std::chrono::seconds(1));
  }
}

}  // namespace

void addRecorderCommand(CLI::App& app, ToolContext& context) {
  const auto arguments = std::make_shared<RecorderArguments>();
  const Command command = addCommand(app, context, "recorder",
                                     "What the recorder (tallyd) holds in memory, and what it "
                                     "refused",
                                     [&context, arguments] { return run(context, *arguments); });
  command.flag("--watch", &arguments->watch, "Show it every second until interrupted");
  command.flag("--commit", &arguments->commit, "Have it commit what it holds to the store");
}

}  // namespace tally::tools
