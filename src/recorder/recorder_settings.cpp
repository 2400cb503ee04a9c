#include "recorder/recorder_settings.h"

#include <algorithm>
#include <cerrno>

#include "base/number_text.h"
#include "kv/plist_codec.h"
#include "platform/recording/ingress.h"

namespace tally {
namespace {

// Of the system and of the store's owner.
constexpr std::string_view kDirectories[] = {"/Library/Preferences",
                                             "/var/mobile/Library/Preferences"};
constexpr std::size_t kLargestFile = 1 << 20;
constexpr std::string_view kOwnKeys = "vellum.";

class Merge {
 public:
  Merge(RecorderSettings& settings, std::string_view file, const UserLookup& users, SystemLog& log)
      : settings_(settings), file_(file), users_(users), log_(log) {}

  void take(std::string_view name, const KvObject& value) {
    const auto* const number = std::ranges::find(kRecorderNumbers, name, &RecorderNumberRow::name);
    if (number != std::end(kRecorderNumbers)) {
      takeNumber(*number, value);
    } else if (name == kSettingPrefix) {
      if (const auto* text = kvCast<KvString>(&value)) {
        settings_.prefix = text->view();
      } else {
        malformed(name, "is not a text");
      }
    } else if (name == kSettingRename) {
      takeRename(value);
    } else if (name == kSettingTags) {
      takeTexts(name, value, settings_.tags);
    } else if (name == kSettingDurable) {
      takeTexts(name, value, settings_.durable);
    } else if (name == kSettingAllow) {
      takeAllow(value);
    } else {
      malformed(name, "is not a setting");
    }
  }

 private:
  void malformed(std::string_view name, std::string_view why) {
    log_.message(LogLevel::Error, "{}: {} {}, and is ignored", file_, name, why);
  }

  void takeNumber(const RecorderNumberRow& row, const KvObject& value) {
    const auto* const number = kvCast<KvNumber>(&value);
    if (number == nullptr || number->isReal() || number->asInt64() < row.least ||
        number->asInt64() > row.most) {
      log_.message(LogLevel::Error, "{}: {} is not a whole number from {} to {}, and is ignored",
                   file_, row.name, row.least, row.most);
      return;
    }
    settings_.numbers[static_cast<std::size_t>(&row - kRecorderNumbers)] = number->asInt64();
  }

  void takeTexts(std::string_view name, const KvObject& value, std::vector<std::string>& texts) {
    const auto* const array = kvCast<KvArray>(&value);
    if (array == nullptr) return malformed(name, "is not an array");
    for (const auto& item : *array) {
      const auto* const text = kvCast<KvString>(item.get());
      if (text == nullptr || text->view().empty()) {
        malformed(name, "has an entry that is not a text");
      } else if (std::ranges::find(texts, text->view()) == texts.end()) {
        texts.emplace_back(text->view());
      }
    }
  }

  void takeRename(const KvObject& value) {
    const auto* const names = kvCast<KvDictionary>(&value);
    if (names == nullptr) return malformed(kSettingRename, "is not a dictionary");
    for (const auto& [from, to] : *names) {
      if (const auto* text = kvCast<KvString>(to.get())) {
        settings_.rename[std::string(from->view())] = text->view();
      } else {
        malformed(kSettingRename, "has an entry that is not a text");
      }
    }
  }

  void takeAllow(const KvObject& value) {
    const auto* const rows = kvCast<KvDictionary>(&value);
    if (rows == nullptr) return malformed(kSettingAllow, "is not a dictionary");
    for (const auto& [prefix, users] : *rows) {
      RecorderSettings::Users allowed;
      const auto* const names = kvCast<KvArray>(users.get());
      // A row that cannot be read must not open what it was to close.
      if (names == nullptr) {
        log_.message(LogLevel::Error,
                     "{}: {} does not name users in an array, so nobody may record such keys",
                     file_, prefix->view());
      }
      for (std::size_t i = 0; names != nullptr && i < names->size(); ++i) {
        takeUser(prefix->view(), names->get(i), allowed);
      }
      settings_.allow[std::string(prefix->view())] = std::move(allowed);
    }
  }

  void takeUser(std::string_view prefix, const KvObject* item, RecorderSettings::Users& allowed) {
    const auto* const number = kvCast<KvNumber>(item);
    if (number != nullptr && !number->isReal() && number->asInt64() >= 0) {
      allowed.numbers.insert(number->asInt64());
      return;
    }
    const auto* const text = kvCast<KvString>(item);
    const std::string_view name = text != nullptr ? text->view() : std::string_view();
    if (name == "*") {
      allowed.everybody = true;
    } else if (name == "anonymous") {
      allowed.numbers.insert(Sender::kAnonymous);
    } else if (const auto parsed =
                   name.empty() || name.front() == '-' ? std::nullopt : parseInt64(name)) {
      allowed.numbers.insert(*parsed);
    } else if (const auto user = users_(name)) {
      allowed.numbers.insert(*user);
    } else {
      log_.message(LogLevel::Error, "{}: there is no user \"{}\", whom {} allows", file_, name,
                   prefix);
    }
  }

  RecorderSettings& settings_;
  std::string_view file_;
  const UserLookup& users_;
  SystemLog& log_;
};

// False, after a line, if it is there and cannot be read.
bool mergeFile(RecorderSettings& settings, const DeviceDirectory& directory,
               const std::string& name, const UserLookup& users, SystemLog& log) {
  const std::string file = directory.text() + "/" + name;
  const auto text = directory.readFile(name, kLargestFile);
  if (!text && text.error().systemError == ENOENT) return true;
  const auto value = text ? decodePlist(*text) : Result<KvRef<KvObject>>(text.error());
  const auto* const dictionary = value ? kvCast<KvDictionary>(value->get()) : nullptr;
  if (dictionary == nullptr) {
    log.message(LogLevel::Error, "{}: {}", file,
                value ? std::string("not a dictionary") : value.error().message);
    return false;
  }
  settings.merge(*dictionary, file, users, log);
  return true;
}

}  // namespace

RecorderSettings::RecorderSettings() {
  std::ranges::transform(kRecorderNumbers, numbers.begin(), &RecorderNumberRow::fallback);
  // The program's own keys are root's, unless a row says otherwise.
  allow[std::string(kOwnKeys)].numbers.insert(0);
}

void RecorderSettings::merge(const KvDictionary& dictionary, std::string_view file,
                             const UserLookup& users, SystemLog& log) {
  Merge merge(*this, file, users, log);
  for (const auto& [name, value] : dictionary) merge.take(name->view(), *value);
}

RecorderSettings readRecorderSettings(const DeviceRoot& root, const UserLookup& users,
                                      SystemLog& log) {
  RecorderSettings settings;
  const std::string domain(kRecorderDomain);
  for (const std::string_view path : kDirectories) {
    const auto take = [&](const DeviceDirectory& directory, const std::string& name) {
      const bool taken = mergeFile(settings, directory, name, users, log);
      settings.complete = settings.complete && taken;
    };
    take(DeviceDirectory(root, std::string(path)), domain + ".plist");
    const DeviceDirectory dropIns(root, std::string(path) + "/" + domain + ".d");
    const auto names = dropIns.list();
    if (!names) {
      log.message(LogLevel::Error, "{}", names.error().message);
      settings.complete = false;
      continue;
    }
    for (const std::string& name : *names) {
      if (name.ends_with(".plist")) take(dropIns, name);
    }
  }
  if (!settings.complete) settings.allow[""] = {.numbers = {0}};
  return settings;
}

}  // namespace tally
