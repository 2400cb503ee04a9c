#include "tools/doctor/health_recorder.h"

#include <cerrno>
#include <chrono>

#include <fmt/format.h>

#include "base/files/device_root.h"
#include "base/printable.h"
#include "host/ingress/recorder_client.h"
#include "host/system/machine/machine.h"
#include "kv/plist_codec.h"
#include "recorder/recorder_settings.h"
#include "recorder/refusal.h"
#include "tools/doctor/error_collector.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

constexpr const char* kRecorderSubject = "recorder";

std::uint64_t numberIn(const KvDictionary& dictionary, std::string_view key) {
  const auto* const number = dictionary.getAs<KvNumber>(key);
  return number != nullptr ? number->asUInt64() : 0;
}

void examineSettings(const DeviceRoot& root, bool served, HealthChecks& checks) {
  constexpr const char* kSettings = "recorder settings";
  ErrorCollector collector;
  const RecorderSettings settings = readRecorderSettings(root, userNumber, collector);
  for (const std::string& error : collector.errors) {
    checks.push_back({Health::Wrong, kSettings, error});
  }
  if (!served || !collector.errors.empty()) return;
  const auto seconds = static_cast<std::uint64_t>(settings.number(RecorderNumber::CommitInterval));
  const auto bytes = static_cast<std::uint64_t>(settings.number(RecorderNumber::MemoryLimit));
  checks.push_back({Health::Ok, kSettings,
                    fmt::format("commits every {}, within {} of memory", counted(seconds, "second"),
                                byteText(bytes))});
}

// "12 (an event or a service check), ..."; empty when nothing was refused.
std::string refusalText(const KvDictionary& status) {
  std::string text;
  const auto* const refused = status.getAs<KvDictionary>("refused");
  for (const RefusalRow& row : kRefusals) {
    const std::uint64_t count = refused != nullptr ? numberIn(*refused, row.name) : 0;
    if (count == 0) continue;
    text += fmt::format("{}{} ({})", text.empty() ? "" : ", ",
                        integerText(static_cast<std::int64_t>(count)), row.meaning);
  }
  return text;
}

void examineStatus(const KvDictionary& status, HealthChecks& checks) {
  const auto* const failure = status.getAs<KvString>("failure");
  checks.push_back(
      {failure == nullptr ? Health::Ok : Health::Wrong, kRecorderSubject,
       fmt::format(
           "{} of {} held in memory, {} since it started{}",
           byteText(numberIn(status, "bytes_held")), byteText(numberIn(status, "bytes_limit")),
           counted(numberIn(status, "metrics"), "metric"),
           failure == nullptr ? ""
                              : fmt::format("; its last commit failed: {}", failure->view()))});
  // The programs that sent it are at fault, or a limit is low; the recorder works.
  const std::string refused = refusalText(status);
  if (!refused.empty())
    checks.push_back({Health::Missing, kRecorderSubject, "refused: " + refused});
}

void ask(const DeviceRoot& root, HealthChecks& checks) {
  constexpr std::chrono::seconds kPatience{5};
  const auto answer = askRecorder(root, "status", kPatience);
  if (answer) {
    const auto value = decodePlist(*answer);
    const auto* const status = value ? kvCast<KvDictionary>(value->get()) : nullptr;
    if (status != nullptr) return examineStatus(*status, checks);
    constexpr std::size_t kMostShown = 200;
    checks.push_back({Health::Wrong, kRecorderSubject,
                      "it does not say how it is: " +
                          fitted(printable(answer->substr(0, kMostShown)), kMostShown, "...")});
    return;
  }
  const bool mayNot = answer.error().systemError == EACCES;
  checks.push_back({mayNot ? Health::Ok : Health::Wrong, kRecorderSubject,
                    mayNot ? "its sockets are served; only root and its own user may ask it more"
                           : answer.error().message});
}

}  // namespace

void examineRecorder(const ToolContext& context, HealthChecks& checks) {
  const DeviceRoot root(context.root);
  const auto unserved = unservedRecorderSockets(root);
  constexpr std::size_t kSockets = 3;
  const bool served = unserved && unserved->size() < kSockets;
  if (!unserved) {
    checks.push_back({Health::Wrong, kRecorderSubject, unserved.error().message});
  } else if (!served) {
    checks.push_back({Health::Missing, kRecorderSubject,
                      "none runs; other programs cannot send metrics to tallyd"});
  } else {
    ask(root, checks);
    for (const std::string& name : *unserved) {
      checks.push_back({Health::Missing, kRecorderSubject, "nobody serves run/tallyd/" + name});
    }
  }
  examineSettings(root, served, checks);
}

}  // namespace tally::tools
