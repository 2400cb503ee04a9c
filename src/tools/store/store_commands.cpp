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
#include "host/store/store_aside.h"
#include "host/store/store_history.h"
#include "host/store/store_writer.h"
#include "tools/frame/command.h"
#include "tools/frame/day_argument.h"
#include "tools/frame/output.h"
#include "tools/frame/table.h"
#include "tools/store/recorded_words.h"
#include "tools/store/store_csv.h"
#include "tools/store/store_dump.h"
#include "tools/store/store_import.h"
#include "tools/store/stores_aside.h"

namespace tally::tools {
namespace {

// What the arguments of a store command were.
struct StoreArguments {
  std::string key, file;
  std::vector<std::string> values;
  std::optional<std::string> day;
  std::optional<std::uint32_t> offset;
  std::string prefix;
  std::optional<std::uint32_t> aside;  // which store that was set aside; else the device's
};

StoreFile storeFile(const ToolContext& context) {
  StoreFile file = metricsStoreFile(context.root);
  file.notify = [&context](const std::string& message) { complain(context, message, kSuccess); };
  return file;
}

// The store to read. Empty after a complaint.
std::optional<StoreFile> storeToRead(const ToolContext& context, const StoreArguments& arguments) {
  StoreFile file = metricsStoreFile(context.root);
  if (!arguments.aside) return file;
  file = storeSetAside(file, *arguments.aside);
  if (file.directory.identity(file.name)) return file;
  complain(context, "there is no " + file.text(), kBadUsage);
  return std::nullopt;
}

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

// The keys and values of the command line or of standard input. Empty after a complaint.
std::optional<std::vector<RecordedWords>> readWords(const ToolContext& context,
                                                    const StoreArguments& arguments,
                                                    WordForm form) {
  std::vector<std::string> words{arguments.key};
  words.insert(words.end(), arguments.values.begin(), arguments.values.end());
  auto recorded = readRecordedWords(words, form, stdin);
  const auto refuse = [&](std::string_view reason) {
    complain(context, reason, kBadUsage);
    return std::nullopt;
  };
  if (!recorded) return refuse(recorded.error().message);
  for (const auto& [key, values] : *recorded) {
    if (!isStoreKey(key)) return refuse(kStoreKeyRule);
  }
  return std::move(*recorded);
}

// Of several keys, which one is meant.
std::string subjectOf(const std::vector<RecordedWords>& words, const std::string& key) {
  return words.size() > 1 ? key + ": " : std::string();
}

// One object for the keys of a command line that names one; else a list.
void printRecorded(const ToolContext& context, const StoreArguments& arguments, Json entries) {
  printJson(context, entries.size() == 1 && arguments.key != "-" ? entries[0] : entries);
}

int setScalars(const ToolContext& context, const StoreArguments& arguments) {
  std::optional<std::int32_t> given;
  if (!readDay(context, arguments, given)) return kBadUsage;
  const auto words = readWords(context, arguments, WordForm::Pairs);
  if (!words) return kBadUsage;
  std::vector<std::int64_t> numbers;
  for (const auto& [key, values] : *words) {
    const auto value = parseInt64(values[0]);
    if (!value) {
      return complain(context,
                      subjectOf(*words, key) + "the value is not a whole number of 64 bits",
                      kBadUsage);
    }
    numbers.push_back(*value);
  }
  const std::int32_t day = given.value_or(context.platform->metricsStore->TBDaysSince1970());
  const auto setAll = [&](StoreWriter& writer) -> Status {
    for (std::size_t i = 0; i < numbers.size(); ++i) {
      if (auto done = writer.setScalar(day, (*words)[i].key, numbers[i]); !done) return done;
    }
    return Done{};
  };
  const Status set = words->empty() ? Status(Done{}) : writeStore(context, setAll);
  if (!set) return complain(context, set.error().message, kWrong);
  Json entries = Json::array();
  for (std::size_t i = 0; i < numbers.size(); ++i) {
    const std::string& key = (*words)[i].key;
    if (context.json) {
      entries.push_back({{"key", key}, {"day", day}, {"value", numbers[i]}});
    } else {
      printLine(context, fmt::format("{} = {} on {}", key, numbers[i], dayName(day)));
    }
  }
  if (context.json) printRecorded(context, arguments, std::move(entries));
  return kSuccess;
}

int pushSamples(const ToolContext& context, const StoreArguments& arguments) {
  std::optional<std::int32_t> given;
  if (!readDay(context, arguments, given)) return kBadUsage;
  const auto words = readWords(context, arguments, WordForm::Groups);
  if (!words) return kBadUsage;
  std::vector<std::vector<double>> samples;  // of each key
  for (const auto& [key, values] : *words) {
    samples.emplace_back();
    for (const std::string& text : values) {
      const auto value = parseDouble(text);
      if (!value) {
        return complain(context, subjectOf(*words, key) + text + " is not a number", kBadUsage);
      }
      samples.back().push_back(*value);
    }
  }
  const double now = context.platform->clock->secondsSince1970();
  const std::int32_t today = dayOfSeconds(now);
  const std::int32_t day = given.value_or(today);
  const std::uint32_t offset = arguments.offset.value_or(
      static_cast<std::uint32_t>(now - static_cast<double>(today) * kSecondsPerDay));
  const auto pushAll = [&](StoreWriter& writer) -> Status {
    for (std::size_t i = 0; i < samples.size(); ++i) {
      const std::vector<std::uint32_t> offsets(samples[i].size(), offset);
      auto done = writer.pushSamples(day, (*words)[i].key, samples[i], offsets);
      if (!done) return done;
    }
    return Done{};
  };
  const Status pushed = words->empty() ? Status(Done{}) : writeStore(context, pushAll);
  if (!pushed) return complain(context, pushed.error().message, kWrong);
  Json entries = Json::array();
  for (std::size_t i = 0; i < samples.size(); ++i) {
    const std::string& key = (*words)[i].key;
    const std::size_t count = samples[i].size();
    if (context.json) {
      entries.push_back({{"key", key}, {"day", day}, {"offset", offset}, {"samples", count}});
    } else {
      printLine(context, fmt::format("{} has {} more {} on {}", key, count,
                                     count == 1 ? "sample" : "samples", dayName(day)));
    }
  }
  if (context.json) printRecorded(context, arguments, std::move(entries));
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
  const auto file = storeToRead(context, arguments);
  if (!file) return kBadUsage;
  std::string fault;
  const auto history = openSqliteHistory(*file, [&](const std::string& message) {
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

int listKeys(const ToolContext& context, const StoreArguments& arguments) {
  const auto file = storeToRead(context, arguments);
  if (!file) return kBadUsage;
  std::string fault;
  const auto keys = gatherKeys(*file, fault);
  if (context.json) {
    printJson(context, keysJson(keys));
  } else {
    printKeys(context, keys);
    const auto aside = describeStoresAside(context.root);
    if (!arguments.aside && !aside.empty()) printLine(context, aside);
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

  constexpr const char* kStoreKeyHelp =
      "Valid UTF-8 of 1 to 512 bytes without a zero byte; - for lines from standard input";
  Command command = store.add("set", "Set scalars in one transaction", setScalars);
  command.argument(kStoreKeyValue, &arguments.key, kStoreKeyHelp);
  command.optionalArgument({"VALUE", ValueKind::Number}, &arguments.values,
                           "A 64-bit whole number; further pairs KEY VALUE may follow");
  addDay(command, kDay);

  command = store.add("push", "Add samples to distributions in one transaction", pushSamples);
  command.argument(kStoreKeyValue, &arguments.key, kStoreKeyHelp);
  command.optionalArgument(
      {"VALUE", ValueKind::Number}, &arguments.values,
      "Numbers, inf or nan; -inf only after --, which ends the options. Further "
      "groups KEY VALUE... may follow, each after a +");
  addDay(command, kDay);
  command
      .option("--offset", {"S", ValueKind::Number}, &arguments.offset,
              "Second of the day; now by default")
      .within(0, 86399);

  store.add("import", "Import CSV: kind,key,day,offset,value[,weight]", import)
      .argument(kFileValue, &arguments.file, "A file, or - for standard input");

  const auto addAside = [&](const Command& reading) {
    reading
        .option("--aside", {"N", ValueKind::Number}, &arguments.aside,
                "Read NAME.newer-N, a store that an older version of the program set aside")
        .within(1, kMostStoresSetAside);
  };
  command = addDay(store.add("dump", "Print all rows as CSV, in the form that import reads", dump),
                   "; all days by default");
  command.option("--prefix", kTextValue, &arguments.prefix, "Only keys that start with it");
  addAside(command);

  addAside(store.add("keys", "List the keys, with their days and numbers of samples", listKeys));
}

}  // namespace tally::tools
