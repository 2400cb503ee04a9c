// Platform: one of each service that the program calls.
#pragma once

#include <memory>
#include <mutex>
#include <string_view>
#include <utility>

#include <fmt/core.h>

#include "platform/analytics_events.h"
#include "platform/applications.h"
#include "platform/clock.h"
#include "platform/counters/daily_counters.h"
#include "platform/crash_reporting.h"
#include "platform/crash_support_library.h"
#include "platform/device_information.h"
#include "platform/device_registry.h"
#include "platform/event_loop.h"
#include "platform/files.h"
#include "platform/flash/flash_disks.h"
#include "platform/ipc_endpoint.h"
#include "platform/kernel_values.h"
#include "platform/locale.h"
#include "platform/log_header_facts.h"
#include "platform/log_submission.h"
#include "platform/metrics_store.h"
#include "platform/notifications.h"
#include "platform/preferences.h"
#include "platform/purgeable_space.h"
#include "platform/recording/recorder_link.h"
#include "platform/run_lock.h"
#include "platform/self.h"
#include "platform/stackshot.h"
#include "platform/system_configuration.h"
#include "platform/system_log.h"

namespace tally {

// The answer to a question that is asked once per process.
struct OnceBoolean {
  std::once_flag asked;
  bool answer = false;
};

// The services; none is null once the platform is installed. Shared, so that a variant of a
// platform (a preview that must change nothing) can replace some and keep the rest.
struct Platform {
  std::shared_ptr<SystemLog> log;
  std::shared_ptr<Clock> clock;
  std::shared_ptr<EventLoop> eventLoop;
  std::shared_ptr<IpcEndpoint> ipcEndpoint;
  std::shared_ptr<Notifications> notifications;
  std::shared_ptr<Files> files;
  std::shared_ptr<RunLock> runLock;
  std::shared_ptr<Preferences> preferences;
  std::shared_ptr<SMASystemConfiguration> systemConfiguration;
  std::shared_ptr<SMAServicesClient> servicesClient;
  std::shared_ptr<MetricsStore> metricsStore;
  std::shared_ptr<LogSubmission> logSubmission;
  std::shared_ptr<CrashReporting> crashReporting;
  std::shared_ptr<CrashSupportLibrary> crashSupportLibrary;
  std::shared_ptr<DeviceInformation> deviceInformation;
  std::shared_ptr<AppRegistry> appRegistry;
  std::shared_ptr<Locale> locale;
  std::shared_ptr<KernelValues> kernelValues;
  std::shared_ptr<DeviceRegistry> deviceRegistry;
  std::shared_ptr<DailyCounters> dailyCounters = std::make_shared<DailyCounters>();
  std::shared_ptr<FlashDisks> flashDisks = std::make_shared<FlashDisks>();
  std::shared_ptr<RecorderLink> recorder = std::make_shared<RecorderLink>();
  std::shared_ptr<Self> self = std::make_shared<Self>();
  std::shared_ptr<Stackshot> stackshot;
  std::shared_ptr<PurgeableSpace> purgeableSpace;
  std::shared_ptr<LogHeaderFacts> logHeaderFacts;
  std::shared_ptr<AnalyticsEvents> analyticsEvents;
  std::shared_ptr<OnceBoolean> internalDevice = std::make_shared<OnceBoolean>();
};

// The platform in force. REQUIRES: one is installed, or there is a default.
Platform& platform();

// Names who makes the platform of a program that installs none, when it is first asked for.
void setDefaultPlatform(Platform& (*make)());

// Installs a platform for a scope and puts the former one back at its end.
class PlatformScope {
 public:
  explicit PlatformScope(Platform services);
  ~PlatformScope();
  PlatformScope(const PlatformScope&) = delete;
  PlatformScope& operator=(const PlatformScope&) = delete;
  Platform& services() { return services_; }

 private:
  Platform services_;
  Platform* former_;
};

// Puts services in force for the calling thread alone, for a scope, which they outlive: a program
// that uses the C functions looks at several devices at once.
class ThreadPlatformScope {
 public:
  explicit ThreadPlatformScope(Platform& services) noexcept;
  ~ThreadPlatformScope();
  ThreadPlatformScope(const ThreadPlatformScope&) = delete;
  ThreadPlatformScope& operator=(const ThreadPlatformScope&) = delete;

 private:
  Platform* const former_;
};

// Services that a handle of a C program owns. While they end, what they log goes to their own log.
std::shared_ptr<Platform> sharePlatform(Platform services);

// A fault in the program's own words; see SystemLog::fault.
template <class... Arguments>
void logFault(std::string_view kind, fmt::format_string<Arguments...> format,
              Arguments&&... arguments) {
  platform().log->fault(kind, format, std::forward<Arguments>(arguments)...);
}

// See SystemLog::repeated.
template <class... Arguments>
void logBounded(LogLevel level, std::string_view kind, fmt::format_string<Arguments...> format,
                Arguments&&... arguments) {
  platform().log->repeated(level, kind, format, std::forward<Arguments>(arguments)...);
}

// See SystemLog::message.
template <class... Arguments>
void logMessage(LogLevel level, fmt::format_string<Arguments...> format, Arguments&&... arguments) {
  platform().log->message(level, format, std::forward<Arguments>(arguments)...);
}

}  // namespace tally
