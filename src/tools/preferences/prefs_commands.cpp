#include "tools/preferences/prefs_commands.h"

#include <algorithm>
#include <cmath>
#include <memory>
#include <nlohmann/json.hpp>
#include <optional>

#include "base/files/file.h"
#include "base/files/temporary_file.h"
#include "base/natural_order.h"
#include "base/number_text.h"
#include "base/utf8.h"
#include "host/linux_platform.h"
#include "host/preferences/property_list_preferences.h"
#include "kv/plist_codec.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "tools/frame/command.h"
#include "tools/frame/table.h"
#include "tools/report/log_view.h"

namespace tally::tools {
namespace {

using Access = PropertyListPreferences::Access;

struct PrefsArguments {
  std::string key;
  std::optional<std::string> value, file;
  std::string type = "auto";
  std::string domain{kProgramDomain};
  std::string listedDomain;  // empty: the domains are listed
};

PropertyListPreferences openPreferences(const ToolContext& context, Access access) {
  return {*userPreferencesFolder(context.root, kProgramUser), context.platform->log, 0600, access};
}

bool isDomainName(const std::string& name) {
  return isSafeFileName(name) && !isTemporaryName(name);
}

// A visible name, also for the empty key.
std::string keyText(const std::string& key) { return key.empty() ? "\"\"" : key; }

int refuseDomain(const ToolContext& context, const std::string& name) {
  return complain(context, "not a name that a domain can have: " + name, kBadUsage);
}

std::string_view typeName(const KvObject& value) {
  if (const auto* number = kvCast<KvNumber>(&value)) return number->isReal() ? "real" : "integer";
  return tools::typeName(value.type());
}

KvRef<KvObject> booleanOf(std::string_view text) {
  if (text == "true" || text == "yes") return KvBoolean::of(true);
  if (text == "false" || text == "no") return KvBoolean::of(false);
  return nullptr;
}
KvRef<KvObject> integerOf(std::string_view text) {
  const auto value = parseInt64(text);
  return value ? KvNumber::int64(*value) : nullptr;
}
KvRef<KvObject> realOf(std::string_view text) {
  const auto value = parseDouble(text);
  return value ? KvNumber::float64(*value) : nullptr;
}
KvRef<KvObject> stringOf(std::string_view text) { return KvString::create(text); }

struct ValueType {
  std::string_view name;
  KvRef<KvObject> (*parse)(std::string_view text);  // null if the text is not such a value
};
// In the order in which a value without a type is tried.
constexpr ValueType kTypes[] = {
    {"boolean", booleanOf}, {"integer", integerOf}, {"real", realOf}, {"string", stringOf}};

// The value that the arguments describe; an error if they contradict each other.
Result<KvRef<KvObject>> valueOf(const PrefsArguments& arguments) {
  if (arguments.file) {
    const auto document = readFile(*arguments.file, kPlistMaximumBytes);
    if (!document) return document.error();
    return decodePlist(*document);
  }
  for (const ValueType& type : kTypes) {
    if (arguments.type != "auto" && arguments.type != type.name) continue;
    if (auto value = type.parse(*arguments.value)) return value;
  }
  return Error{
      fmt::format("\"{}\" is not a value of the type {}", *arguments.value, arguments.type)};
}

int get(const ToolContext& context, const PrefsArguments& arguments) {
  if (!isDomainName(arguments.domain)) return refuseDomain(context, arguments.domain);
  auto preferences = openPreferences(context, Access::ReadOnly);
  const auto value = preferences.SMAPreferencesGetValue(arguments.key, arguments.domain);
  if (context.json) {
    printJson(context, {{"domain", arguments.domain},
                        {"key", arguments.key},
                        {"type", value ? Json(typeName(*value)) : Json(nullptr)},
                        {"value", jsonOf(value.get())}});
    return value ? kSuccess : kWrong;
  }
  if (!value) {
    return complain(context, fmt::format("{} has no {}", arguments.domain, keyText(arguments.key)),
                    kWrong);
  }
  const bool isContainer = value->type() == KvType::Array || value->type() == KvType::Dictionary;
  if (isContainer) {
    printJson(context, jsonOf(value.get()));
  } else {
    printLine(context, value->type() == KvType::Data ? jsonOf(value.get()).get<std::string>()
                                                     : valueText(value.get()));
  }
  return kSuccess;
}

// Whether a domain's file returns the key and the value unchanged: XML can contain neither control
// characters nor bytes that are not UTF-8.
bool canBeStored(const std::string& key, const std::string& text, const KvRef<KvObject>& value) {
  if (!isValidUtf8(key) || !isValidUtf8(text)) return false;
  const auto entry = KvDictionary::create({{key, value}});
  const auto document = encodeXmlPlist(*entry);
  const auto stored = document ? decodePlist(*document) : Result<KvRef<KvObject>>(document.error());
  return stored && kvEqual(stored->get(), entry.get());
}

int write(const ToolContext& context, const PrefsArguments& arguments, KvRef<KvObject> value) {
  auto preferences = openPreferences(context, Access::ReadWrite);
  preferences.SMAPreferencesSetValue(arguments.key, value, arguments.domain);
  if (!preferences.SMAPreferencesSynchronize(arguments.domain)) {
    // What is pending would be tried once more at the end, and fail with the same line.
    return complain(context, "nothing was written", kWrong);
  }
  if (context.json) {
    printJson(
        context,
        {{"domain", arguments.domain}, {"key", arguments.key}, {"value", jsonOf(value.get())}});
  } else if (value) {
    printLine(context, fmt::format("{} {} = {} ({})", arguments.domain, keyText(arguments.key),
                                   valueText(value.get()), typeName(*value)));
  } else {
    printLine(context, fmt::format("{} {} deleted", arguments.domain, keyText(arguments.key)));
  }
  return kSuccess;
}

int set(const ToolContext& context, const PrefsArguments& arguments) {
  if (!arguments.value && !arguments.file) {
    return complain(context, "VALUE or --file is required (see tallyctl prefs set --help)",
                    kBadUsage);
  }
  if (!isDomainName(arguments.domain)) return refuseDomain(context, arguments.domain);
  const auto value = valueOf(arguments);
  if (!value) return complain(context, value.error().message, kBadUsage);
  if (!canBeStored(arguments.key, arguments.value.value_or(""), *value)) {
    return complain(context,
                    fmt::format("{} cannot be stored as given: a property list has no control "
                                "characters, only valid UTF-8",
                                keyText(arguments.key)),
                    kBadUsage);
  }
  return write(context, arguments, *value);
}

int remove(const ToolContext& context, const PrefsArguments& arguments) {
  if (!isDomainName(arguments.domain)) return refuseDomain(context, arguments.domain);
  auto preferences = openPreferences(context, Access::ReadOnly);
  if (!preferences.SMAPreferencesGetValue(arguments.key, arguments.domain)) {
    return complain(context, fmt::format("{} has no {}", arguments.domain, keyText(arguments.key)),
                    kWrong);
  }
  return write(context, arguments, nullptr);
}

struct ListedDomain {
  std::string name;
  std::size_t keys;
};

int listDomains(const ToolContext& context, PropertyListPreferences& preferences) {
  auto names = preferences.listDomains();
  if (!names) return complain(context, names.error().message, kWrong);
  std::ranges::sort(*names, naturalLess);
  std::vector<ListedDomain> domains;
  for (const std::string& name : *names) {
    domains.push_back({name, preferences.copyDomain(name)->size()});
  }
  if (context.json) {
    Json document = Json::array();
    for (const auto& [name, keys] : domains) document.push_back({{"domain", name}, {"keys", keys}});
    printJson(context, document);
  } else if (domains.empty()) {
    printLine(context, "no preferences are set");
  } else {
    Table table({{"domain", Align::Left, true}, {"keys", Align::Right}});
    for (const auto& [name, keys] : domains) {
      table.add({name, integerText(static_cast<std::int64_t>(keys))});
    }
    table.print(context);
  }
  return kSuccess;
}

int list(const ToolContext& context, const PrefsArguments& arguments) {
  auto preferences = openPreferences(context, Access::ReadOnly);
  if (arguments.listedDomain.empty()) return listDomains(context, preferences);
  if (!isDomainName(arguments.listedDomain)) return refuseDomain(context, arguments.listedDomain);
  const auto all = preferences.copyDomain(arguments.listedDomain);
  if (context.json) {
    Json document = Json::object();
    for (const auto* entry : entriesByName(*all)) {
      addMember(document, std::string(entry->key->view()), jsonOf(entry->value.get()));
    }
    printJson(context, document);
  } else if (all->empty()) {
    return complain(context, "no preferences are set in " + arguments.listedDomain, kWrong);
  } else {
    Table table({{"key", Align::Left, true}, {"type"}, {"value", Align::Left, true}});
    for (const auto* entry : entriesByName(*all)) {
      table.add({keyText(std::string(entry->key->view())), std::string(typeName(*entry->value)),
                 valueText(entry->value.get())});
    }
    table.print(context);
  }
  return all->empty() ? kWrong : kSuccess;
}

}  // namespace

void addPrefsCommands(CLI::App& app, ToolContext& context) {
  CommandGroup<PrefsArguments> prefs(addFamily(app, "prefs", "Read and write preferences"),
                                     context);
  PrefsArguments& arguments = prefs.arguments();
  constexpr Value kDomainValue{"DOMAIN", ValueKind::Domain};
  const auto addKey = [&](Command command) {
    command.argument({"PREFERENCE", ValueKind::Preference}, &arguments.key, "Its key");
    command.option("--domain", kDomainValue, &arguments.domain, "The domain").showsDefault();
    return command;
  };

  addKey(prefs.add("get", "Print a preference", get));

  Command command = addKey(prefs.add("set", "Write a preference", set));
  const Option value =
      command.optionalArgument({"VALUE", ValueKind::Text}, &arguments.value, "The value as text");
  const Option file =
      command
          .option("--file", kFileValue, &arguments.file,
                  "A property list whose root is the value: for arrays, dictionaries, data")
          .excludes(value);
  command
      .option("--type", {"TYPE", ValueKind::Text}, &arguments.type,
              "string, integer, real or boolean; auto uses the first that fits of boolean "
              "(true, false, yes, no), integer, real, string")
      .oneOf({"auto", "string", "integer", "real", "boolean"})
      .excludes(file);

  addKey(prefs.add("delete", "Remove a preference", remove));

  prefs.add("list", "List the domains of preferences, or the keys of one", list)
      .option("--domain", kDomainValue, &arguments.listedDomain,
              "The domain whose keys are listed");
}

}  // namespace tally::tools
