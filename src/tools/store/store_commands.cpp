#include "tools/store/store_commands.h"

#include <algorithm>
#include <limits>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/files/file.h"
#include "base/natural_order.h"
#include "base/number_text.h"
#include "base/time_text.h"
#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_writer.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"
#include "tools/store/store_csv.h"
#include "tools/store/store_dump.h"
#include "tools/store/store_import.h"

namespace tally::tools {
namespace {

// What the arguments of a store command were.
struct StoreArguments {
  std::string key, value, file;
  std::vector<std::string> values;
  std::optional<std::string> day;
  std::optional<std::uint32_t> offset;
  std::string prefix;
};

StoreFile storeFile(const ToolContext& context) { return metricsStoreFile(context.root); }

template <class Work>
Status writeStore(const ToolContext& context, const Work& work) {
  auto opened = StoreWriter::open(storeFile(context), IfMissing::Create);
  if (!opened) return opened.error();
  StoreWriter& writer = **opened;
  if (auto begun = writer.begin(); !begun) return begun;
  if (Status done = work(writer); !done) return done;
  return writer.commit();
}

// The day that was given, if any. False, after a complaint, when it is not a day.
bool readDay(const ToolContext& context, const StoreArguments& arguments,
             std::optional<std::int32_t>& day) {
  if (!arguments.day) return true;
  day = dayOf(context, *arguments.day);
  return day.has_value();
}

int setScalar(const ToolContext& context, const StoreArguments& arguments) {
  std::optional<std::int32_t> given;
  if (!readDay(context, arguments, given)) return kBadUsage;
  const auto value = parseInt64(arguments.value);
  if (!value) return complain(context, "the value is not a whole number of 64 bits", kBadUsage);
  if (!isStoreKey(arguments.key)) return complain(context, kStoreKeyRule, kBadUsage);
  const std::int32_t day = given.value_or(context.platform->metricsStore->TBDaysSince1970());
  const Status set = writeStore(
      context, [&](StoreWriter& writer) { return writer.setScalar(day, arguments.key, *value); });
  if (!set) return complain(context, set.error().message, kWrong);
  if (context.json) {
    printJson(context, {{"key", arguments.key}, {"day", day}, {"value", *value}});
  } else {
    printLine(context, fmt::format("{} = {} on {}", arguments.key, *value, dayName(day)));
  }
  return kSuccess;
}

int pushSamples(const ToolContext& context, const StoreArguments& arguments) {
  std::optional<std::int32_t> given;
  if (!readDay(context, arguments, given)) return kBadUsage;
  std::vector<double> values;
  for (const std::string& text : arguments.values) {
    const auto value = parseDouble(text);
    if (!value) return complain(context, text + " is not a number", kBadUsage);
    values.push_back(*value);
  }
  if (!isStoreKey(arguments.key)) return complain(context, kStoreKeyRule, kBadUsage);
  const double now = context.platform->clock->secondsSince1970();
  const std::int32_t today = dayOfSeconds(now);
  const std::int32_t day = given.value_or(today);
  const std::uint32_t offset = arguments.offset.value_or(
      static_cast<std::uint32_t>(now - static_cast<double>(today) * kSecondsPerDay));
  const std::vector<std::uint32_t> offsets(values.size(), offset);
  const Status pushed = writeStore(context, [&](StoreWriter& writer) {
    return writer.pushSamples(day, arguments.key, values, offsets);
  });
  if (!pushed) return complain(context, pushed.error().message, kWrong);
  if (context.json) {
    printJson(
        context,
        {{"key", arguments.key}, {"day", day}, {"offset", offset}, {"samples", values.size()}});
  } else {
    printLine(context, fmt::format("{} has {} more {} on {}", arguments.key, values.size(),
                                   values.size() == 1 ? "sample" : "samples", dayName(day)));
  }
  return kSuccess;
}

void printImport(const ToolContext& context, const ImportResult& result) {
  for (const BadLine& bad : result.firstRejected) {
    complain(context, fmt::format("line {}: {}", bad.line, bad.reason), kWrong);
  }
  if (const auto more = result.rejected - result.firstRejected.size(); more > 0) {
    complain(context, fmt::format("and {} more bad {}", more, more == 1 ? "line" : "lines"),
             kWrong);
  }
  if (!context.json) {
    if (result.failure.empty()) {
      print(context.out,
            fmt::format("imported {} and {}; {}\n", counted(result.scalars, "scalar"),
                        counted(result.samples, "sample"), counted(result.rejected, "bad line")));
    }
    return;
  }
  Json bad = Json::array();
  for (const auto& [line, reason] : result.firstRejected) {
    bad.push_back({{"line", line}, {"reason", reason}});
  }
  const bool stored = result.failure.empty();
  printJson(context, {{"scalars", stored ? result.scalars : 0},
                      {"samples", stored ? result.samples : 0},
                      {"rejected", result.rejected},
                      {"firstRejected", bad}});
}

int import(const ToolContext& context, const StoreArguments& arguments) {
  std::unique_ptr<std::FILE, int (*)(std::FILE*)> owned(nullptr, std::fclose);
  std::FILE* file = stdin;
  if (arguments.file != "-") {
    owned.reset(std::fopen(arguments.file.c_str(), "rbe"));
    if (!owned) {
      const char* const reason = std::strerror(errno);
      return complain(context, fmt::format("cannot open {}: {}", arguments.file, reason), kWrong);
    }
    file = owned.get();
  }
  const std::uint64_t bytes = owned ? fileSize(arguments.file).value_or(0) : 0;
  const ImportResult result = importStoreCsv(file, bytes, storeFile(context), context);
  printImport(context, result);
  if (!result.failure.empty()) {
    return complain(context, "nothing was imported: " + result.failure, kWrong);
  }
  return result.rejected == 0 ? kSuccess : kWrong;
}

int dump(const ToolContext& context, const StoreArguments& arguments) {
  std::optional<std::int32_t> day;
  if (!readDay(context, arguments, day)) return kBadUsage;
  DumpRange range;
  range.keyPrefix = arguments.prefix;
  if (day) {
    // The lower end of the range is exclusive; there is no day before the smallest.
    range.minimumDay = *day == range.minimumDay ? *day : *day - 1;
    range.maximumDay = *day;
  }
  std::string fault;
  const auto history = openSqliteHistory(storeFile(context), [&](const std::string& message) {
    if (fault.empty()) fault = message;
  });
  if (context.json) {
    dumpAsJson(*history, range, context.out);
  } else {
    // On a terminal, keys are made safe to show; in a file, they can be imported again.
    dumpAsCsv(*history, range, context.out, context.output.interactive);
  }
  return fault.empty() ? kSuccess : complain(context, fault, kWrong);
}

struct ListedKey {
  StoreKey::Kind kind;
  std::string name;
  std::int64_t firstDay, lastDay, days;
  std::int64_t samples;  // of a distribution
  bool isScalar() const { return kind == StoreKey::Kind::Scalar; }
  const char* kindText() const { return isScalar() ? "scalar" : "distribution"; }
};

// Scalars first, by name. What went wrong, if anything, goes to fault.
std::vector<ListedKey> gatherKeys(const StoreFile& file, std::string& fault) {
  std::vector<ListedKey> keys;
  listStoreKeys(
      file,
      [&keys](const StoreKey& key) {
        keys.push_back(
            {key.kind, std::string(key.key), key.firstDay, key.lastDay, key.days, key.samples});
      },
      [&](const std::string& message) { fault = message; });
  std::ranges::stable_sort(keys, [](const ListedKey& a, const ListedKey& b) {
    return a.kind != b.kind ? a.kind < b.kind : naturalLess(a.name, b.name);
  });
  return keys;
}

Json keysJson(const std::vector<ListedKey>& keys) {
  Json document = Json::array();
  for (const ListedKey& key : keys) {
    Json entry = {{"kind", key.kindText()},
                  {"key", key.name},
                  {"firstDay", key.firstDay},
                  {"lastDay", key.lastDay},
                  {"days", key.days}};
    if (!key.isScalar()) entry["samples"] = key.samples;
    document.push_back(std::move(entry));
  }
  return document;
}

void printKeys(const ToolContext& context, const std::vector<ListedKey>& keys) {
  if (keys.empty()) return printLine(context, "the store has no keys");
  Table table({{"kind"},
               {"days", Align::Right},
               {"first"},
               {"last"},
               {"samples", Align::Right},
               {"key", Align::Left, true}});
  for (const ListedKey& key : keys) {
    table.add({key.kindText(), integerText(key.days),
               dayText(static_cast<std::int32_t>(key.firstDay)),
               dayText(static_cast<std::int32_t>(key.lastDay)),
               key.isScalar() ? "" : integerText(key.samples), key.name});
  }
  table.print(context);
}

int listKeys(const ToolContext& context, const StoreArguments&) {
  std::string fault;
  const auto keys = gatherKeys(storeFile(context), fault);
  if (context.json) {
    printJson(context, keysJson(keys));
  } else {
    printKeys(context, keys);
  }
  return fault.empty() ? kSuccess : complain(context, fault, kWrong);
}

}  // namespace

void addStoreCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<StoreArguments> store(addFamily(app, "store", "Write and read the metrics store"),
                                     context);
  StoreArguments& arguments = store.arguments();
  const auto addDay = [&](Command command, const char* otherwise) {
    command.option("--day", kDayValue, &arguments.day, kDayForms + std::string(otherwise));
    return command;
  };
  constexpr const char* kDay = "; today by default";

  constexpr const char* kStoreKeyHelp = "Valid UTF-8 of 1 to 512 bytes without a zero byte";
  Command command = store.add("set", "Set a scalar", setScalar);
  command.argument(kStoreKeyValue, &arguments.key, kStoreKeyHelp);
  command.argument({"VALUE", ValueKind::Number}, &arguments.value, "A 64-bit whole number");
  addDay(command, kDay);

  command = store.add("push", "Add samples to a distribution", pushSamples);
  command.argument(kStoreKeyValue, &arguments.key, kStoreKeyHelp);
  command.argument({"VALUE", ValueKind::Number}, &arguments.values,
                   "Numbers, inf or nan; -inf only after --, which ends the options");
  addDay(command, kDay);
  command
      .option("--offset", {"S", ValueKind::Number}, &arguments.offset,
              "Second of the day; now by default")
      .within(0, 86399);

  store.add("import", "Import CSV: kind,key,day,offset,value", import)
      .argument(kFileValue, &arguments.file, "A file, or - for standard input");

  addDay(store.add("dump", "Print all rows as CSV, in the form that import reads", dump),
         "; all days by default")
      .option("--prefix", kTextValue, &arguments.prefix, "Only keys that start with it");

  store.add("keys", "List the keys, with their days and numbers of samples", listKeys);
}

}  // namespace tally::tools
