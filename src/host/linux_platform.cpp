#include "host/linux_platform.h"

#include "host/bus/bus_endpoint.h"
#include "host/bus/bus_notifications.h"
#include "host/bus/event_loop.h"
#include "host/described/described_purgeable_space.h"
#include "host/described/described_stackshot.h"
#include "host/ingress/recorder_client.h"
#include "host/preferences/preference_services.h"
#include "host/preferences/property_list_preferences.h"
#include "host/spool/analytics_events.h"
#include "host/spool/crash_reporting.h"
#include "host/spool/log_spool.h"
#include "host/spool/submission_consent.h"
#include "host/store/metrics_store.h"
#include "host/store/store_schema.h"
#include "host/system/applications.h"
#include "host/system/clock.h"
#include "host/system/crash_support_library.h"
#include "host/system/device_information.h"
#include "host/system/environment.h"
#include "host/system/files.h"
#include "host/system/kernel_values.h"
#include "host/system/locale.h"
#include "host/system/log_header_facts.h"
#include "host/system/machine/linux_self.h"
#include "host/system/run_lock.h"
#include "host/system/system_log.h"

namespace tally {
namespace {

// The data folder of the user who runs the program, which belongs to the device only if the device
// is this machine.
std::string userDataFolder(const DeviceRoot& root) {
  if (!root.prefix().empty()) return "";
  const std::string data = environmentVariable("XDG_DATA_HOME");
  if (data.starts_with('/')) return data;
  const std::string home = environmentVariable("HOME");
  return home.starts_with('/') ? home + "/.local/share" : "";
}

}  // namespace

Platform makeLinuxPlatform(const DeviceRoot& root, const LinuxPlatformOptions& options) {
  const DeviceDirectory described(root, "/device");
  const auto log = options.log ? options.log : makeSystemLogOfEnvironment();
  const auto clock = options.clock ? options.clock : std::make_shared<LinuxClock>();
  const auto description = std::make_shared<DeviceDescription>(described, log);
  const auto access = options.readOnlyPreferences ? PropertyListPreferences::Access::ReadOnly
                                                  : PropertyListPreferences::Access::ReadWrite;
  const auto preferences = std::make_shared<PropertyListPreferences>(
      userPreferencesFolder(root, kProgramUser).value(), log, 0600, access);
  const auto eventLoop = std::make_shared<SdEventLoop>(log);
  const auto bus = std::make_shared<BusConnection>();

  const auto tree = options.tree ? options.tree : std::make_shared<const SystemTree>(root);
  const auto consent = std::make_shared<SubmissionConsent>(root, log, preferences, description);

  Platform services;
  services.log = log;
  services.clock = clock;
  services.eventLoop = eventLoop;
  services.ipcEndpoint = std::make_shared<BusEndpoint>(bus, eventLoop, log);
  services.notifications = std::make_shared<BusNotifications>(bus, log, root.prefix().empty());
  services.files = std::make_shared<RootedFiles>(root);
  services.runLock = std::make_shared<FileRunLock>(runLockFolder(root), log);
  services.preferences = preferences;
  services.systemConfiguration = std::make_shared<FileSystemConfiguration>(root, log, access);
  services.servicesClient = std::make_shared<FileServicesClient>(root, log, access);
  StoreFile store = metricsStoreFile(root);
  store.notify = [log](const std::string& message) { log->write(LogLevel::Error, message); };
  services.metricsStore =
      makeSqliteMetricsStore(std::move(store), log, clock, kMostStoreBytes, preferences);
  services.crashReporting =
      std::make_shared<LinuxCrashReporting>(root, log, clock, preferences, consent);
  services.crashSupportLibrary = std::make_shared<LinuxCrashSupportLibrary>(description);
  services.deviceInformation = std::make_shared<LinuxDeviceInformation>(root, description);
  services.logSubmission =
      std::make_shared<SpoolSubmission>(spoolFolder(root), log, clock, preferences, consent,
                                        services.deviceInformation, services.notifications);
  services.appRegistry = std::make_shared<DesktopAppRegistry>(
      applicationFolders(root, userDataFolder(root)), description);
  services.locale = std::make_shared<LinuxLocale>(
      root,
      LocaleEnvironment{environmentVariable("LANGUAGE"), environmentVariable("LC_ALL"),
                        environmentVariable("LC_MESSAGES"), environmentVariable("LANG")},
      description);
  services.kernelValues = std::make_shared<LinuxKernelValues>(description, tree);
  services.recorder = std::make_shared<SocketRecorderLink>(root);
  services.self = std::make_shared<LinuxSelf>();
  services.stackshot = std::make_shared<DescribedStackshot>(described, description);
  services.purgeableSpace = std::make_shared<DescribedPurgeableSpace>(description);
  services.logHeaderFacts =
      std::make_shared<LinuxLogHeaderFacts>(services.deviceInformation, description, tree);
  services.analyticsEvents = std::make_shared<LinuxAnalyticsEvents>(
      analyticsEventsFolder(root), log, clock, preferences, description, consent);
  return services;
}

}  // namespace tally
