#include "tools/preferences/prefs_commands.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cmath>
#include <memory>
#include <nlohmann/json.hpp>

#include "base/file.h"
#include "base/number_text.h"
#include "base/temporary_file.h"
#include "base/utf8.h"
#include "host/linux_platform.h"
#include "host/preferences/property_list_preferences.h"
#include "kv/plist_codec.h"
#include "platform/known_preferences.h"
#include "platform/platform.h"
#include "tools/frame/natural_order.h"
#include "tools/frame/table.h"
#include "tools/report/log_view.h"

namespace tally::tools {
namespace {

using Access = PropertyListPreferences::Access;

struct PrefsArguments {
  std::string key, value, file;
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

// A name for a line of text: the empty key is a key, too.
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
  KvRef<KvObject> (*parse)(std::string_view text);  // null when the text is no such value
};
// In the order in which a value without a type is tried.
constexpr ValueType kTypes[] = {
    {"boolean", booleanOf}, {"integer", integerOf}, {"real", realOf}, {"string", stringOf}};

// What the arguments say the value is; an error when they contradict each other.
Result<KvRef<KvObject>> valueOf(const PrefsArguments& arguments) {
  if (!arguments.file.empty()) {
    const auto document = readFile(arguments.file, kPlistMaximumBytes);
    if (!document) return document.error();
    return decodePlist(*document);
  }
  for (const ValueType& type : kTypes) {
    if (arguments.type != "auto" && arguments.type != type.name) continue;
    if (auto value = type.parse(arguments.value)) return value;
  }
  return Error{
      fmt::format("\"{}\" is not a value of the type {}", arguments.value, arguments.type)};
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

// Whether a domain's file gives the key and the value back as they are: XML carries neither control
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
  if (!isDomainName(arguments.domain)) return refuseDomain(context, arguments.domain);
  const auto value = valueOf(arguments);
  if (!value) return complain(context, value.error().message, kBadUsage);
  if (!canBeStored(arguments.key, arguments.value, *value)) {
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

int listDomains(const ToolContext& context, PropertyListPreferences& preferences) {
  auto domains = preferences.listDomains();
  if (!domains) return complain(context, domains.error().message, kWrong);
  Table table({{"domain", Align::Left, true}, {"keys", Align::Right}});
  Json document = Json::array();
  std::ranges::sort(*domains, naturalLess);
  for (const std::string& domain : *domains) {
    const auto keys = preferences.copyDomain(domain)->size();
    table.add({domain, integerText(static_cast<std::int64_t>(keys))});
    document.push_back({{"domain", domain}, {"keys", keys}});
  }
  if (context.json) {
    printJson(context, document);
  } else if (table.empty()) {
    printLine(context, "no preferences are set");
  } else {
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
  const auto arguments = std::make_shared<PrefsArguments>();
  CLI::App* const prefs = app.add_subcommand("prefs", "Read and write preferences");
  prefs->require_subcommand(1);
  const auto add = [&](const char* name, const char* description, auto run) {
    return addCommand(prefs, context, name, description,
                      [&context, arguments, run] { return run(context, *arguments); });
  };
  const auto addKey = [&](CLI::App* command) {
    command->add_option("PREFERENCE", arguments->key, "Its key")->required();
    command->add_option("--domain", arguments->domain, "The domain")
        ->type_name("DOMAIN")
        ->capture_default_str();
  };

  addKey(add("get", "Print a value", get));

  CLI::App* command = add("set", "Write a value", set);
  addKey(command);
  CLI::Option* const value = command->add_option("VALUE", arguments->value, "The value as text");
  CLI::Option* const file =
      command
          ->add_option("--file", arguments->file,
                       "A property list whose root is the value: for arrays, dictionaries, data")
          ->type_name("FILE")
          ->excludes(value);
  command
      ->add_option("--type", arguments->type,
                   "string, integer, real or boolean; auto uses the first that fits of boolean "
                   "(true, false, yes, no), integer, real, string")
      ->check(CLI::IsMember({"auto", "string", "integer", "real", "boolean"}))
      ->type_name("TYPE")
      ->excludes(file);
  command->callback([&context, arguments, value, file] {
    if (value->count() + file->count() == 0) throw CLI::RequiredError("VALUE or --file");
    context.command = [&context, arguments] { return set(context, *arguments); };
  });

  addKey(add("delete", "Remove a value", remove));

  command = add("list", "List the domains, or the keys of one", list);
  command->add_option("--domain", arguments->listedDomain, "The domain whose keys are listed")
      ->type_name("DOMAIN");
}

}  // namespace tally::tools
