// Checks of what the device and the machine answer.
#include "tools/doctor/health_services.h"

#include <algorithm>
#include <vector>

#include <fmt/format.h>

#include "base/time_text.h"
#include "config/internal_device.h"
#include "host/system/system_log.h"
#include "platform/platform.h"
#include "platform/tables/known_preferences.h"
#include "report/device_metrics.h"
#include "tools/frame/output.h"

namespace tally::tools {
namespace {

void examineClock(Platform& platform, HealthChecks& checks) {
  constexpr double kFirstSane = kFirstPlausibleDay * kSecondsPerDay;
  constexpr double kLastSane = 4102444800;  // 2100-01-01
  const double now = platform.clock->secondsSince1970();
  std::string text;
  appendTimestamp(text, now);
  const bool sane = now >= kFirstSane && now < kLastSane;
  checks.push_back({sane ? Health::Ok : Health::Wrong, "clock",
                    sane ? text : text + " cannot be now: it was never set"});
}

// The text as one word of a POSIX shell.
std::string shellWord(std::string_view text) {
  std::string word = "'";
  for (const char c : text) word += c == '\'' ? std::string("'\\''") : std::string(1, c);
  return word + "'";
}

void examineDay(const ToolContext& context, HealthChecks& checks) {
  constexpr const char* kSubject = "last day";
  const std::int32_t yesterday = context.platform->metricsStore->TBDaysSince1970() - 1;
  const std::int32_t last = context.platform->preferences->SMAPreferencesGetIntegerValue(
      kLastProcessedDay.key, kProgramDomain);
  if (last == 0) {
    checks.push_back({Health::Missing, kSubject, "tallyrun -d has processed no day yet"});
  } else if (last > yesterday) {
    // With a clock that was never set, it is the clock that has to be repaired.
    const bool clockIsSet = yesterday >= kFirstPlausibleDay;
    checks.push_back(
        {Health::Wrong, kSubject,
         fmt::format("{} was processed, which is not over: no day is processed until then",
                     dayName(last)),
         clockIsSet ? fmt::format("tallyctl --root {} prefs set {} {}", shellWord(context.root),
                                  kLastProcessedDay.key, yesterday - 1)
                    : ""});
  } else {
    checks.push_back({last == yesterday ? Health::Ok : Health::Missing, kSubject,
                      fmt::format("{} was processed{}", dayName(last),
                                  last == yesterday ? "" : "; yesterday is still to come")});
  }
}

void examineLogging(HealthChecks& checks) {
  const SystemLogEnvironment found = systemLogEnvironment();
  const bool journal = journalIsThere() && !found.settings.forceStandardError;
  checks.push_back(
      {journal || found.settings.forceStandardError ? Health::Ok : Health::Missing, "system log",
       fmt::format("{}, from the level {} up",
                   journal                             ? "the journal"
                   : found.settings.forceStandardError ? "standard error, by TALLYRUN_LOG"
                                                       : "no journal here; standard error",
                   levelText(found.settings.lowest))});
  if (!found.fault.empty()) checks.push_back({Health::Wrong, "system log", found.fault});
}

void examineIdentity(Platform& platform, HealthChecks& checks) {
  DeviceInformation& device = *platform.deviceInformation;
  const std::string version = device.SMAOSVersion();
  const bool known = version != "unknown";
  checks.push_back({known ? Health::Ok : Health::Missing, "system version", version});
  const auto identifier = device.DeviceQuery("InverseDeviceID");
  checks.push_back({identifier ? Health::Ok : Health::Missing, "device identifier",
                    identifier ? kvText(identifier.get()) : "none"});
  const auto usage = device.DeviceQuery("DiskUsage");
  const auto* disk = kvCast<KvDictionary>(usage.get());
  const auto bytes = [&](std::string_view key) {
    const auto* number = disk != nullptr ? disk->getAs<KvNumber>(key) : nullptr;
    return number != nullptr ? byteText(number->asUInt64()) : std::string("unknown");
  };
  checks.push_back({disk != nullptr ? Health::Ok : Health::Missing, "disk",
                    disk != nullptr
                        ? fmt::format("{} of {} available", bytes(kDOQDiskUsageTotalDataAvailable),
                                      bytes(kDOQDiskUsageTotalDiskCapacity))
                        : "its usage is not known"});
  checks.push_back({Health::Ok, "kind of device",
                    isInternalDevice(platform) ? "internal: every key is reported" : "production"});
}

void examineUser(Platform& platform, HealthChecks& checks) {
  const bool allowed = platform.crashReporting->isDiagnosticSubmissionEnabled();
  checks.push_back({allowed ? Health::Ok : Health::Missing, "submission",
                    allowed ? "allowed" : "not allowed; no log is made"});
  const auto languages = platform.locale->PreferredLanguages();
  const auto region = platform.locale->CurrentRegionCode();
  checks.push_back({languages.empty() ? Health::Missing : Health::Ok, "locale",
                    fmt::format("{}{}", fmt::join(languages, ", "),
                                languages.empty() ? "no preferred language" : "") +
                        (region ? ", region " + *region : ", no region")});
  std::uint64_t all = 0;
  std::uint64_t users = 0;
  platform.appRegistry->enumerateBundles(kBundleKindApplication, [&](std::string_view type) {
    ++all;
    if (type == UserAppType) ++users;
  });
  checks.push_back({all > 0 ? Health::Ok : Health::Missing, "applications",
                    fmt::format("{}, {} of them the user's", all, users)});
}

void examineCrashSupport(Platform& platform, HealthChecks& checks) {
  constexpr const char* kSubject = "crash support";
  CrashSupportLibrary& library = *platform.crashSupportLibrary;
  if (!library.open(kCrashSupportPath)) {
    checks.push_back({Health::Missing, kSubject, "the library is missing"});
    return;
  }
  std::vector<std::string_view> missing;
  for (const std::string_view symbol : kCrashSupportSymbols) {
    if (!library.hasSymbol(symbol)) missing.push_back(symbol);
  }
  checks.push_back(
      {missing.empty() ? Health::Ok : Health::Missing, kSubject,
       missing.empty() ? "complete" : fmt::format("lacks {}", fmt::join(missing, ", "))});
}

void examineKernel(Platform& platform, HealthChecks& checks) {
  constexpr std::size_t kNamed = 3;
  std::vector<std::string> missing;
  const auto names = kernelValuesOfReport();
  for (const KernelValueName& value : names) {
    std::byte buffer[32];
    std::size_t length = value.width;
    const int error = platform.kernelValues->readKernelValue(
        value.name, {buffer, std::min(sizeof buffer, value.width)}, &length);
    if (error != 0) missing.emplace_back(value.name);
  }
  std::string text =
      fmt::format("{} of {} can be read", names.size() - missing.size(), names.size());
  if (!missing.empty() && missing.size() <= kNamed) {
    text += fmt::format("; not {}", fmt::join(missing, ", "));
  }
  checks.push_back({missing.empty() ? Health::Ok : Health::Missing, "kernel values", text});
  const auto timebase = platform.kernelValues->TimebaseInfo();
  const bool counts = timebase && timebase->denominator != 0;
  checks.push_back(
      {counts ? Health::Ok : Health::Wrong, "tick counter",
       counts ? fmt::format("{} ticks since boot", platform.kernelValues->MonotonicTicks())
              : "its timebase cannot be read"});
}

}  // namespace

void examineServices(const ToolContext& context, HealthChecks& checks) {
  Platform& platform = *context.platform;
  examineClock(platform, checks);
  examineDay(context, checks);
  examineLogging(checks);
  examineIdentity(platform, checks);
  examineUser(platform, checks);
  examineCrashSupport(platform, checks);
  examineKernel(platform, checks);
}

}  // namespace tally::tools
