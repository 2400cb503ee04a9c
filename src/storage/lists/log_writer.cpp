// The NAND log writer: a dictionary as one line of text below a header.
#include "storage/lists/log_writer.h"

#include <cmath>
#include <exception>
#include <optional>
#include <string>

#include "base/time_text.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "storage/storage_log.h"

namespace tally {
namespace {

constexpr const KnownPreference& kLastLogged = knownPreference("SSLastLoggedAt");
constexpr std::string_view kLogName = "StorageStatus";

// Too early also when the clock was set back, so that there is no second log.
bool isTooEarly(double now) {
  const auto last = lastStorageLog();
  if (!last || !(now - *last < kSecondsBetweenStorageLogs)) return false;
  logMessage(LogLevel::Default, "NANDLogWriter:Last written at {} current {} :skipped",
             kvText(KvDate::create(*last).get()), kvText(KvDate::create(now).get()));
  return true;
}

// Booleans are printed as numbers.
bool isNumber(const KvObject* value) {
  return kvCast<KvNumber>(value) != nullptr || kvCast<KvBoolean>(value) != nullptr;
}

std::string numberText(const KvObject* value) {
  const auto* const number = kvCast<KvNumber>(value);
  if (number == nullptr || !number->isReal() || std::isnan(number->asDouble())) {
    return kvText(value);
  }
  return fmt::format("{:.2f}", number->asDouble());
}

// Empty for an array without numbers.
std::string arrayText(const KvArray& array) {
  std::string text;
  bool holdsNumber = false;
  for (const auto& element : array) {
    if (&element != &*array.begin()) text += ',';
    text += kvText(element.get());
    holdsNumber = holdsNumber || isNumber(element.get());
  }
  return holdsNumber ? text : std::string();
}

std::string itemsOf(const KvDictionary& values) {
  std::string items;
  for (const auto& [key, value] : values) {
    std::string text;
    if (const auto* array = kvCast<KvArray>(value.get())) {
      text = arrayText(*array);
    } else if (isNumber(value.get())) {
      text = numberText(value.get());
    }
    if (text.empty()) continue;
    if (!items.empty()) items += ';';
    items.append(key->view()).append(":").append(text);
  }
  return items;
}

void writeLog(std::string_view logTypeCode, const KvDictionary* values) {
  const double now = platform().clock->secondsSince1970();
  if (isTooEarly(now) || values == nullptr) return;
  LogHeaderFacts& facts = *platform().logHeaderFacts;
  const std::string date = dateAndTimeText(now);
  const std::string text = fmt::format(
      "System ID: {}\nHardware Model: {}\nOS Version: {}\nDate: {}\nIncident ID: {}\n"
      "FaultDesk Key: {}\n\n{} {}[{}]: {}\n",
      facts.SysIdDescription(), facts.HardwareModelString(), facts.SystemVersionString(), date,
      facts.NewIncidentID(), GetFaultDeskKey(), date, facts.processName(),
      facts.processIdentifier(), itemsOf(*values));
  platform().logSubmission->SMAWriteLogForSubmission(logTypeCode, kLogName, nullptr, nullptr,
                                                     [&text](LogFile& file) { file.write(text); });
  // Also after a failure: a device that cannot submit must not try every day.
  platform().preferences->set(kLastLogged, KvDate::create(now));
  platform().preferences->SMAPreferencesSynchronize(kLastLogged.domain);
}

}  // namespace

std::optional<double> lastStorageLog() {
  const auto value = platform().preferences->get(kLastLogged);
  const auto* const date = kvCast<KvDate>(value.get());
  if (date == nullptr) return std::nullopt;
  return date->secondsSince1970();
}

void NLW_WriteLog(std::string_view logTypeCode, const KvDictionary* values) {
  try {
    writeLog(logTypeCode, values);
  } catch (const std::exception& exception) {
    logMessage(LogLevel::Default, "An exception occurred: {}", exception.what());
  }
}

std::string GetFaultDeskKey() {
  const auto answer = platform().deviceInformation->DeviceQuery("InverseDeviceID");
  const auto* const key = kvCast<KvString>(answer.get());
  return key != nullptr ? std::string(key->view()) : "error";
}

}  // namespace tally
