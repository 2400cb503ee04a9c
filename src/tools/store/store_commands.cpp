#include "tools/store/store_commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <limits>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>
#include <vector>

#include "base/file.h"
#include "base/number_text.h"
#include "base/time_text.h"
#include "host/linux_platform.h"
#include "host/store/store_history.h"
#include "host/store/store_writer.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/natural_order.h"
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
  std::string dayForm;              // as it was given; empty when it was not
  std::optional<std::int32_t> day;  // the day that it names
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

int setScalar(const ToolContext& context, const StoreArguments& arguments) {
  const auto value = parseInt64(arguments.value);
  if (!value) return complain(context, "the value is not a whole number of 64 bits", kBadUsage);
  if (!isStoreKey(arguments.key)) return complain(context, kStoreKeyRule, kBadUsage);
  const std::int32_t day =
      arguments.day.value_or(context.platform->metricsStore->TBDaysSince1970());
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
  std::vector<double> values;
  for (const std::string& text : arguments.values) {
    const auto value = parseDouble(text);
    if (!value) return complain(context, text + " is not a number", kBadUsage);
    values.push_back(*value);
  }
  if (!isStoreKey(arguments.key)) return complain(context, kStoreKeyRule, kBadUsage);
  const double now = context.platform->clock->secondsSince1970();
  const std::int32_t today = dayOfSeconds(now);
  const std::int32_t day = arguments.day.value_or(today);
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
    complain(context, fmt::format("and {} more bad lines", more), kWrong);
  }
  if (!context.json) {
    if (result.failure.empty()) {
      print(context.out, fmt::format("imported {} scalars and {} samples; {} bad lines\n",
                                     result.scalars, result.samples, result.rejected));
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
  DumpRange range;
  range.keyPrefix = arguments.prefix;
  if (arguments.day) {
    // The range is open at its lower end; the least day of all has none below it.
    range.minimumDay = *arguments.day == range.minimumDay ? *arguments.day : *arguments.day - 1;
    range.maximumDay = *arguments.day;
  }
  std::string fault;
  const auto history = openSqliteHistory(storeFile(context), [&](const std::string& message) {
    if (fault.empty()) fault = message;
  });
  if (context.json) {
    dumpAsJson(*history, range, context.out);
  } else {
    // A person gets keys that are safe to look at; a file those that can be imported again.
    dumpAsCsv(*history, range, context.out, context.output.interactive);
  }
  return fault.empty() ? kSuccess : complain(context, fault, kWrong);
}

struct ListedKey {
  StoreKey key;
  std::string name;  // what the key's view would refer to
};

int listKeys(const ToolContext& context, const StoreArguments&) {
  std::vector<ListedKey> keys;
  std::string fault;
  listStoreKeys(
      storeFile(context),
      [&keys](const StoreKey& key) {
        keys.push_back({key, std::string(key.key)});
      },
      [&](const std::string& message) { fault = message; });
  std::ranges::stable_sort(keys, [](const ListedKey& a, const ListedKey& b) {
    return a.key.kind != b.key.kind ? a.key.kind < b.key.kind : naturalLess(a.name, b.name);
  });
  Json document = Json::array();
  Table table({{"kind"},
               {"days", Align::Right},
               {"first"},
               {"last"},
               {"samples", Align::Right},
               {"key", Align::Left, true}});
  for (const auto& [key, name] : keys) {
    const bool isScalar = key.kind == StoreKey::Kind::Scalar;
    const char* const kind = isScalar ? "scalar" : "distribution";
    if (context.json) {
      Json entry = {{"kind", kind},
                    {"key", name},
                    {"firstDay", key.firstDay},
                    {"lastDay", key.lastDay},
                    {"days", key.days}};
      if (!isScalar) entry["samples"] = key.samples;
      document.push_back(std::move(entry));
      continue;
    }
    table.add({kind, integerText(key.days), dayText(static_cast<std::int32_t>(key.firstDay)),
               dayText(static_cast<std::int32_t>(key.lastDay)),
               isScalar ? "" : integerText(key.samples), name});
  }
  if (context.json) {
    printJson(context, document);
  } else if (table.empty()) {
    printLine(context, "the store has no keys");
  } else {
    table.print(context);
  }
  return fault.empty() ? kSuccess : complain(context, fault, kWrong);
}

// False when what was given is not a day.
bool resolveDay(const ToolContext& context, StoreArguments& arguments) {
  if (arguments.dayForm.empty()) return true;
  arguments.day = dayOf(context, arguments.dayForm);
  return arguments.day.has_value();
}

}  // namespace

void addStoreCommands(CLI::App& app, ToolContext& context) {
  const auto arguments = std::make_shared<StoreArguments>();
  CLI::App* const store = app.add_subcommand("store", "Write and read the metrics store");
  store->require_subcommand(1);
  const auto add = [&](const char* name, const char* description, auto run) {
    CLI::App* const command = store->add_subcommand(name, description);
    command->callback([&context, arguments, run] {
      context.command = [&context, arguments, run] {
        return resolveDay(context, *arguments) ? run(context, *arguments) : kBadUsage;
      };
    });
    return command;
  };
  const auto addDay = [&](CLI::App* command, const char* otherwise) {
    command->add_option("--day", arguments->dayForm, kDayForms + std::string(otherwise))
        ->type_name("DAY");
  };
  constexpr const char* kDay = "; today by default";

  constexpr const char* kStoreKeyHelp = "Valid UTF-8 of 1 to 512 bytes without a zero byte";
  CLI::App* command = add("set", "Set a scalar", setScalar);
  command->add_option("KEY", arguments->key, kStoreKeyHelp)->required();
  command->add_option("VALUE", arguments->value, "A 64-bit whole number")->required();
  addDay(command, kDay);

  command = add("push", "Add samples to a distribution", pushSamples);
  command->add_option("KEY", arguments->key, kStoreKeyHelp)->required();
  command
      ->add_option("VALUE", arguments->values,
                   "Numbers, inf or nan; -inf only after --, which ends the options")
      ->required();
  addDay(command, kDay);
  command->add_option("--offset", arguments->offset, "Second of the day; now by default")
      ->check(CLI::Range(0, 86399))
      ->type_name("S");

  command = add("import", "Import CSV: kind,key,day,offset,value", import);
  command->add_option("FILE", arguments->file, "A file, or - for standard input")->required();

  command = add("dump", "Print all rows as CSV, in the form that import reads", dump);
  addDay(command, "; all days by default");
  command->add_option("--prefix", arguments->prefix, "Only keys that start with it")
      ->type_name("TEXT");

  add("keys", "List the keys, with their days and numbers of samples", listKeys);
}

}  // namespace tally::tools
