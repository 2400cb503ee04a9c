// Checks of what lies below the device root.
#include <algorithm>
#include <limits>

#include "base/device_root.h"
#include "kv/plist_codec.h"
#include "platform/linux/device_information.h"
#include "platform/linux/linux_platform.h"
#include "platform/linux/log_spool.h"
#include "platform/linux/property_list_preferences.h"
#include "platform/linux/store_history.h"
#include "platform/linux/store_schema.h"
#include "tools/daily_log.h"
#include "tools/health_checks.h"
#include "tools/output.h"
#include "tools/spelling.h"
#include "tools/whitelist_check.h"

namespace tally::tools {
namespace {

using Lines = std::vector<HealthLine>;

// Keeps the errors that a check provokes, so that they stand in its own lines.
class ErrorCollector final : public SystemLog {
 public:
  ErrorCollector() : SystemLog(Repeats::All) {}
  std::vector<std::string> errors;
  bool enabled(LogLevel level) const override { return level == LogLevel::Error; }
  void write(LogLevel level, std::string_view message) override {
    if (enabled(level)) errors.emplace_back(message);
  }
};

void examineRoot(const DeviceRoot& root, Lines& lines) {
  const auto directory = root.open("/");
  lines.push_back({directory ? Health::Ok : Health::Wrong, "device root",
                   directory ? directory->path() : directory.error().message});
  const auto volume = openDataVolume(root);
  const auto space = volume ? volume->freeSpace() : std::nullopt;
  if (!space) return;
  const bool enough = *space > kReservedBytes;
  lines.push_back(
      {enough ? Health::Ok : Health::Wrong, "free space",
       fmt::format("{}; logs leave {} free", byteText(*space), byteText(kReservedBytes))});
}

// The entries of the description and what each must be.
struct DescribedEntry {
  std::string_view key;
  KvType type;
};
constexpr DescribedEntry kDescribed[] = {
    {"DeviceAnswers", KvType::Dictionary},
    {"HasInternalDiagnostics", KvType::Boolean},
    {"OSVersion", KvType::String},
    {"SystemVersion", KvType::Dictionary},
    {"Applications", KvType::Array},
    {"PreferredLanguages", KvType::Array},
    {"SystemLanguages", KvType::Array},
    {"RegionCode", KvType::String},
    {"DiagnosticSubmissionEnabled", KvType::Boolean},
    {"CrashSupport", KvType::Dictionary},
    {"KernelValues", KvType::Dictionary},
    {"MonotonicTicks", KvType::Number},
    {"Timebase", KvType::Dictionary},
};

void examineDescription(const DeviceRoot& root, Lines& lines) {
  constexpr const char* kSubject = "device description";
  const auto document = root.readFile("/device/device.plist", kPlistMaximumBytes);
  if (!document) {
    const bool absent = !root.identity("/device/device.plist");
    lines.push_back({absent ? Health::Missing : Health::Wrong, kSubject,
                     absent ? "none; Linux answers for the device" : document.error().message});
    return;
  }
  const auto decoded = decodePlist(*document);
  const auto* entries = decoded ? kvCast<KvDictionary>(decoded->get()) : nullptr;
  if (entries == nullptr) {
    lines.push_back(
        {Health::Wrong, kSubject,
         decoded ? "device/device.plist is not a dictionary" : decoded.error().message});
    return;
  }
  std::vector<std::string_view> names;
  for (const DescribedEntry& known : kDescribed) names.push_back(known.key);
  lines.push_back({Health::Ok, kSubject,
                   entries->size() == 1 ? "1 entry" : fmt::format("{} entries", entries->size())});
  for (const auto& entry : *entries) {
    const std::string_view key = entry.key->view();
    const auto* known = std::ranges::find(kDescribed, key, &DescribedEntry::key);
    if (known != std::end(kDescribed) && entry.value->type() != known->type) {
      lines.push_back(
          {Health::Wrong, kSubject, fmt::format("{} is of the wrong type and is ignored", key)});
    } else if (const auto meant = nearestWord(key, names); meant && known == std::end(kDescribed)) {
      lines.push_back(
          {Health::Wrong, kSubject, fmt::format("{} is not known; {} may be meant", key, *meant)});
    }
  }
}

void examineWhitelist(Lines& lines) {
  constexpr const char* kSubject = "whitelist";
  const WhitelistFile file = loadWhitelistFile();
  if (!file.root) {
    const bool there = platform().files->fileSize(kWhitelistPath).has_value();
    lines.push_back({there ? Health::Wrong : Health::Missing, kSubject,
                     (there ? file.fault : std::string("none")) + "; nothing is reported"});
    return;
  }
  const auto findings = checkWhitelist(*file.root);
  const auto faults =
      static_cast<std::size_t>(std::ranges::count(findings, Severity::Fault, &Finding::severity));
  lines.push_back({faults > 0 ? Health::Wrong : Health::Ok, kSubject,
                   fmt::format("{}, {}{}", counted(faults, "fault"),
                               counted(findings.size() - faults, "surprise"),
                               findings.empty() ? "" : "; see tallyctl whitelist check")});
  for (const auto& group : *file.root) {
    if (groupState(group.key->view()) == GroupState::DisabledByTasking) {
      lines.push_back({Health::Missing, kSubject,
                       fmt::format("the group {} is disabled by tasking", group.key->view())});
    }
  }
}

void examineStore(const DeviceRoot& root, Lines& lines) {
  constexpr const char* kSubject = "metrics store";
  const StoreFile file = metricsStoreFile(root);
  const auto identity = file.directory.identity(file.name);
  if (!identity) {
    lines.push_back({Health::Missing, kSubject, "none yet; there is nothing to report"});
    return;
  }
  std::uint64_t scalars = 0;
  std::uint64_t distributions = 0;
  std::int64_t lastDay = std::numeric_limits<std::int32_t>::min();
  std::string fault;
  listStoreKeys(
      file,
      [&](const StoreKey& key) {
        ++(key.kind == StoreKey::Kind::Scalar ? scalars : distributions);
        lastDay = std::max(lastDay, key.lastDay);
      },
      [&](const std::string& message) { fault = message; });
  if (!fault.empty()) {
    lines.push_back({Health::Wrong, kSubject, fault});
    return;
  }
  std::string text = counted(scalars, "scalar") + ", " + counted(distributions, "distribution");
  if (scalars + distributions > 0) {
    text += ", up to " + dayName(static_cast<std::int32_t>(lastDay));
  }
  lines.push_back({Health::Ok, kSubject, text + ", " + byteText(identity->size)});
  if (scalars + distributions > 0 && lastDay > platform().metricsStore->TBDaysSince1970()) {
    lines.push_back({Health::Wrong, kSubject, "it has days that have not come yet"});
  }
}

void examinePreferences(const DeviceRoot& root, Lines& lines) {
  constexpr const char* kSubject = "preferences";
  const DeviceDirectory folder = *userPreferencesFolder(root, kProgramUser);
  const auto collector = std::make_shared<ErrorCollector>();
  PropertyListPreferences preferences(folder, collector, 0600,
                                      PropertyListPreferences::Access::ReadOnly);
  const auto domains = preferences.listDomains();
  if (!domains) {
    lines.push_back({Health::Wrong, kSubject, domains.error().message});
    return;
  }
  for (const std::string& domain : *domains) (void)preferences.copyDomain(domain);
  for (const std::string& error : collector->errors) {
    lines.push_back({Health::Wrong, kSubject, error});
  }
  if (collector->errors.empty()) {
    lines.push_back({domains->empty() ? Health::Missing : Health::Ok, kSubject,
                     domains->empty() ? "none are set" : counted(domains->size(), "domain")});
  }
  const auto names = folder.list();
  const auto aside =
      names ? std::ranges::count_if(*names,
                                    [](const std::string& name) {
                                      return name.find(".plist.damaged-") != std::string::npos;
                                    })
            : 0;
  if (aside > 0) {
    lines.push_back(
        {Health::Wrong, kSubject,
         fmt::format("{} set aside in {}",
                     counted(static_cast<std::uint64_t>(aside), "damaged file"), folder.text())});
  }
}

void examineSpool(const ToolContext& context, Lines& lines) {
  constexpr const char* kSubject = "submitted logs";
  const SubmittedLogs spool(context);
  const auto logs = spool.list();
  if (!logs) {
    lines.push_back({Health::Wrong, kSubject, logs.error().message});
    return;
  }
  std::uint64_t bytes = 0;
  for (const SpooledLog& log : *logs) bytes += log.bytes;
  const FolderBounds bounds = folderBounds(*platform().preferences);
  lines.push_back({logs->empty() ? Health::Missing : Health::Ok, kSubject,
                   logs->empty() ? "none yet"
                                 : fmt::format("{} with {}; at most {} and {} are kept",
                                               counted(logs->size(), "log"), byteText(bytes),
                                               bounds.maximumLogs, byteText(bounds.maximumBytes))});
  for (const SpooledLog& log : *logs) {
    const auto body = spool.read(log);
    const bool sound = body && (!isDailyLog(log) || DailyLog::parse(*body)) && !log.name.empty();
    if (!sound) lines.push_back({Health::Wrong, kSubject, log.fileName + " is damaged"});
  }
}

}  // namespace

void examineFiles(const ToolContext& context, Lines& lines) {
  const DeviceRoot root(context.root);
  examineRoot(root, lines);
  examineDescription(root, lines);
  examinePreferences(root, lines);
  examineWhitelist(lines);
  examineStore(root, lines);
  examineSpool(context, lines);
}

}  // namespace tally::tools
