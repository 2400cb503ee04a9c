#include "driver/app_info_listener.h"

#include <fmt/core.h>

#include <span>
#include <string>

#include "base/hex.h"
#include "base/result.h"

namespace tally {
namespace {

// A signed 64-bit field. A number of another width is of another type.
const KvNumber* int64Field(const KvDictionary& dictionary, std::string_view key) {
  const auto* const number = dictionary.getAs<KvNumber>(key);
  return number != nullptr && number->kind() == KvNumberKind::Int64 ? number : nullptr;
}

std::int64_t int64Or0(const KvDictionary& dictionary, std::string_view key) {
  const KvNumber* const number = int64Field(dictionary, key);
  return number != nullptr ? number->asInt64() : 0;
}

// Of 8-4-4-4-12 hexadecimal digits, in upper case.
std::string uuidText(std::span<const std::byte> bytes) {
  std::string text;
  text.reserve(36);
  for (std::size_t i = 0; i < bytes.size(); ++i) {
    if (i == 4 || i == 6 || i == 8 || i == 10) text += '-';
    appendHex(text, std::to_integer<unsigned>(bytes[i]), 2, kUpperHexDigits);
  }
  return text;
}

Result<KvRef<KvDictionary>> makeApplication(const KvObject* element) {
  const auto* const fields = kvCast<KvDictionary>(element);
  if (fields == nullptr) return Error{"not a dictionary"};
  auto application = KvDictionary::create(std::size(kApplicationFields));
  for (const auto& [sent, logged, kind] : kApplicationFields) {
    switch (kind) {
      case ApplicationFieldKind::Text: {
        auto* const text = fields->getAs<KvString>(sent);
        if (text == nullptr) return Error{fmt::format("no text \"{}\"", sent)};
        application->set(logged, KvRef<KvString>::share(text));
        break;
      }
      case ApplicationFieldKind::Number:
        application->set(logged, KvNumber::int64(int64Or0(*fields, sent)));
        break;
      case ApplicationFieldKind::Uuid: {
        const auto* const uuid = fields->getAs<KvData>(sent);
        if (uuid == nullptr || uuid->bytes().size() != kUuidBytes) {
          return Error{fmt::format("no \"{}\" of {} bytes", sent, kUuidBytes)};
        }
        application->set(logged, KvString::create(uuidText(uuid->bytes())));
        break;
      }
    }
  }
  return application;
}

}  // namespace

KvRef<KvArray> makeAppInformation(SystemLog& log, const KvArray& appData) {
  auto information = KvArray::create(appData.size());
  std::string firstFault;
  for (std::size_t i = 0; i < appData.size(); ++i) {
    auto application = makeApplication(appData.get(i));
    if (application) {
      information->append(*std::move(application));
    } else if (firstFault.empty()) {
      firstFault = fmt::format("element {}: {}", i, application.error().message);
    }
  }
  if (const auto skipped = appData.size() - information->size(); skipped > 0) {
    log.fault("app_data: lists with elements skipped", "app_data: {} of {} elements skipped; {}",
              skipped, appData.size(), firstFault);
  }
  return information;
}

bool AppInfoListener::start() {
  return platform_.ipcEndpoint->listen(
      kServiceName, [this](const KvDictionary& message) { handleMessage(message); });
}

bool AppInfoListener::stop() { return platform_.ipcEndpoint->stopListening(); }

void AppInfoListener::reportSkipped(std::string_view what) {
  const std::string line = fmt::format("message skipped: {}", what);
  platform_.log->fault(line, "{}", line);
}

void AppInfoListener::handleMessage(const KvDictionary& message) {
  const KvNumber* const operation = int64Field(message, "operation");
  if (operation == nullptr) {
    reportSkipped("no 64-bit integer \"operation\"");
    return;
  }
  // Only the low 32 bits count.
  const std::int32_t code = operation->asInt32();
  if (code == kAppData) {
    receiveAppData(message);
    return;
  }
  const KvNumber* const value = int64Field(message, "value");
  if (code == kRunDay && value == nullptr && !acted_.test()) {
    reportSkipped("no 64-bit integer \"value\"");
    return;
  }
  if (acted_.test_and_set()) return;
  if (code == kRunDay) {
    tasks_.runDaily(value->asInt32(), nullptr);
  } else if (code == kLoggingStatus) {
    isAppInfoRequested_ = true;
    platform_.notifications->postSystemNotification(kLoggingNotification);
    platform_.log->message(LogLevel::Default,
                           "notified of logging status, waiting for activate app info");
  }
}

void AppInfoListener::receiveAppData(const KvDictionary& message) {
  const auto* const appData = message.getAs<KvArray>("app_data");
  if (appData == nullptr) {
    reportSkipped("no array \"app_data\"");
    return;
  }
  const auto information = makeAppInformation(*platform_.log, *appData);
  // The text of a long list is made only if it is logged.
  if (platform_.log->enabled(LogLevel::Default)) {
    platform_.log->repeated(LogLevel::Default, "tallyrun got AAI", "tallyrun got {}AAI:\n{}",
                            isAppInfoRequested_ ? "requested" : "(unsolicited -- so ignoring) ",
                            kvText(information.get()));
  }
  if (!isAppInfoRequested_) return;
  tasks_.runIfNewDay(information.get());
  isAppInfoRequested_ = false;
}

}  // namespace tally
