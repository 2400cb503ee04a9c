// Checks of what lies below the device root.
#include "tools/doctor/health_files.h"

#include <algorithm>
#include <iterator>
#include <limits>

#include "base/files/device_root.h"
#include "base/files/set_aside.h"
#include "host/described/described_entries.h"
#include "host/linux_platform.h"
#include "host/preferences/property_list_preferences.h"
#include "host/spool/log_spool.h"
#include "host/spool/submitted_hooks.h"
#include "host/store/store_history.h"
#include "host/store/store_schema.h"
#include "host/system/device_information.h"
#include "kv/plist_codec.h"
#include "tools/doctor/error_collector.h"
#include "tools/frame/output.h"
#include "tools/frame/spelling.h"
#include "tools/metrics/known_metrics.h"
#include "tools/report/daily_log.h"
#include "tools/store/stores_aside.h"
#include "tools/whitelist/metric_check.h"
#include "tools/whitelist/whitelist_check.h"

namespace tally::tools {
namespace {

void examineRoot(const DeviceRoot& root, HealthChecks& checks) {
  const auto directory = root.open("/");
  checks.push_back({directory ? Health::Ok : Health::Wrong, "device root",
                    directory ? directory->path() : directory.error().message});
  const auto volume = openDataVolume(root);
  const auto space = volume ? volume->freeSpace() : std::nullopt;
  if (!space) return;
  const bool enough = *space > kReservedBytes;
  checks.push_back(
      {enough ? Health::Ok : Health::Wrong, "free space",
       fmt::format("{}; logs leave {} free", byteText(*space), byteText(kReservedBytes))});
}

std::string withArticle(std::string_view noun) {
  if (noun == "data") return std::string(noun);
  return fmt::format("{} {}", noun.starts_with('a') ? "an" : "a", noun);
}

// Names what is not of its type, and what is near to a name that is known.
template <class Entries>
void examineEntries(const KvDictionary& found, const Entries& known, const std::string& place,
                    HealthChecks& checks) {
  constexpr const char* kSubject = "device description";
  std::vector<std::string_view> names;
  for (const auto& entry : known) names.push_back(entry.name);
  for (const auto& [key, value] : found) {
    const auto entry =
        std::ranges::find(known, key->view(), &std::ranges::range_value_t<Entries>::name);
    const std::string name = place + std::string(key->view());
    if (entry == std::ranges::end(known)) {
      if (const auto meant = nearestWord(key->view(), names)) {
        checks.push_back({Health::Wrong, kSubject,
                          fmt::format("{} is not known; {}{} may be meant", name, place, *meant)});
      }
    } else if (value->type() != entry->type) {
      checks.push_back(
          {Health::Wrong, kSubject,
           fmt::format("{} is {}, not {}, and is ignored", name,
                       withArticle(typeName(value->type())), withArticle(typeName(entry->type)))});
    } else if constexpr (requires { entry->members; }) {
      if (!entry->members.empty()) {
        examineEntries(static_cast<const KvDictionary&>(*value), entry->members, name + ".",
                       checks);
      }
    }
  }
}

void examineDescription(const DeviceRoot& root, HealthChecks& checks) {
  constexpr const char* kSubject = "device description";
  const auto document = root.readFile("/device/device.plist", kPlistMaximumBytes);
  if (!document) {
    const bool absent = !root.identity("/device/device.plist");
    checks.push_back({absent ? Health::Missing : Health::Wrong, kSubject,
                      absent ? "none; Linux answers for the device" : document.error().message});
    return;
  }
  const auto decoded = decodePlist(*document);
  const auto* entries = decoded ? kvCast<KvDictionary>(decoded->get()) : nullptr;
  if (entries == nullptr) {
    checks.push_back(
        {Health::Wrong, kSubject,
         decoded ? "device/device.plist is not a dictionary" : decoded.error().message});
    return;
  }
  checks.push_back({Health::Ok, kSubject, counted(entries->size(), "entry")});
  examineEntries(*entries, kDescribedEntries, "", checks);
}

void examineWhitelist(const ToolContext& context, HealthChecks& checks) {
  constexpr const char* kSubject = "whitelist";
  Platform& platform = *context.platform;
  const WhitelistFile file = loadWhitelistFile(platform);
  if (!file.content) {
    const bool there = platform.files->fileSize(kWhitelistPath).has_value();
    checks.push_back({there ? Health::Wrong : Health::Missing, kSubject,
                      (there ? file.fault : std::string("none")) + "; nothing is reported"});
    return;
  }
  std::vector<Finding> findings = checkWhitelist(platform, *file.content);
  const KnownMetrics metrics(MetricTable::load(context.root, [&](const std::string& message) {
    findings.push_back({Severity::Fault, "", "", "", "", message});
  }));
  std::ranges::move(checkMetrics(context, metrics, *file.content), std::back_inserter(findings));
  const auto faults =
      static_cast<std::size_t>(std::ranges::count(findings, Severity::Fault, &Finding::severity));
  checks.push_back({faults > 0 ? Health::Wrong : Health::Ok, kSubject,
                    fmt::format("{}, {}{}", counted(faults, "fault"),
                                counted(findings.size() - faults, "surprise"),
                                findings.empty() ? "" : "; see tallyctl whitelist check")});
  for (const auto& group : file.content->groups()) {
    const std::string_view name = file.content->nameOf(group);
    const GroupState state = groupState(platform, name);
    if (state == GroupState::DisabledByTasking || state == GroupState::SwitchUnreadable) {
      checks.push_back(
          {Health::Missing, kSubject, fmt::format("the group {} {}", name, whyNotInForce(state))});
    }
  }
}

void examineStore(Platform& platform, const DeviceRoot& root, HealthChecks& checks) {
  constexpr const char* kSubject = "metrics store";
  if (const std::string aside = describeStoresAside(root); !aside.empty()) {
    checks.push_back({Health::Wrong, kSubject, aside});
  }
  const StoreFile file = metricsStoreFile(root);
  const auto identity = file.directory.identity(file.name);
  if (!identity) {
    checks.push_back({Health::Missing, kSubject, "none yet; there is nothing to report"});
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
    checks.push_back({Health::Wrong, kSubject, fault});
    return;
  }
  std::string text = counted(scalars, "scalar") + ", " + counted(distributions, "distribution");
  if (scalars + distributions > 0) {
    text += ", up to " + dayName(static_cast<std::int32_t>(lastDay));
  }
  checks.push_back({Health::Ok, kSubject, text + ", " + byteText(identity->size)});
  if (scalars + distributions > 0 && lastDay > platform.metricsStore->TBDaysSince1970()) {
    checks.push_back({Health::Wrong, kSubject, "it has days that have not come yet"});
  }
}

void examinePreferences(const DeviceRoot& root, HealthChecks& checks) {
  constexpr const char* kSubject = "preferences";
  const DeviceDirectory folder = *userPreferencesFolder(root, kProgramUser);
  const auto collector = std::make_shared<ErrorCollector>();
  PropertyListPreferences preferences(folder, collector, 0600,
                                      PropertyListPreferences::Access::ReadOnly);
  const auto domains = preferences.listDomains();
  if (!domains) {
    checks.push_back({Health::Wrong, kSubject, domains.error().message});
    return;
  }
  for (const std::string& domain : *domains) (void)preferences.copyDomain(domain);
  for (const std::string& error : collector->errors) {
    checks.push_back({Health::Wrong, kSubject, error});
  }
  if (collector->errors.empty()) {
    checks.push_back({domains->empty() ? Health::Missing : Health::Ok, kSubject,
                      domains->empty() ? "none are set" : counted(domains->size(), "domain")});
  }
  const auto names = folder.list();
  const auto aside = names ? std::ranges::count_if(*names,
                                                   [](const std::string& name) {
                                                     const std::string mark =
                                                         ".plist" + asideMark(kDamagedWord);
                                                     return name.find(mark) != std::string::npos;
                                                   })
                           : 0;
  if (aside > 0) {
    checks.push_back(
        {Health::Wrong, kSubject,
         fmt::format("{} set aside in {}",
                     counted(static_cast<std::uint64_t>(aside), "damaged file"), folder.text())});
  }
}

void examineSpool(const ToolContext& context, HealthChecks& checks) {
  constexpr const char* kSubject = "submitted logs";
  const SubmittedLogs spool(context);
  const auto logs = spool.list();
  if (!logs) {
    checks.push_back({Health::Wrong, kSubject, logs.error().message});
    return;
  }
  std::uint64_t bytes = 0;
  for (const SpooledLog& log : *logs) bytes += log.bytes;
  const FolderBounds bounds = folderBounds(*context.platform->preferences);
  checks.push_back(
      {logs->empty() ? Health::Missing : Health::Ok, kSubject,
       logs->empty()
           ? "none yet"
           : fmt::format("{} with {}; at most {} and {} are kept", counted(logs->size(), "log"),
                         byteText(bytes), bounds.maximumLogs, byteText(bounds.maximumBytes))});
  for (const SpooledLog& log : *logs) {
    const std::string_view fault = faultOf(log, spool.read(log));
    if (fault.empty()) continue;
    checks.push_back({Health::Wrong, kSubject, fmt::format("{} is {}", log.fileName, fault)});
  }
}

// Only a device that has them has a line.
void examineHooks(const DeviceRoot& root, HealthChecks& checks) {
  constexpr const char* kSubject = "hooks";
  if (!root.identity(kHooksFolder)) return;
  const auto hooks = openHooks(root);
  checks.push_back(hooks ? HealthCheck{Health::Ok, kSubject,
                                       counted(hooks->size(), "hook") + " for submitted logs"}
                         : HealthCheck{Health::Wrong, kSubject, hooks.error().message});
}

}  // namespace

void examineFiles(const ToolContext& context, HealthChecks& checks) {
  const DeviceRoot root(context.root);
  examineRoot(root, checks);
  examineDescription(root, checks);
  examinePreferences(root, checks);
  examineWhitelist(context, checks);
  examineStore(*context.platform, root, checks);
  examineSpool(context, checks);
  examineHooks(root, checks);
}

}  // namespace tally::tools
