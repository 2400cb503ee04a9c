// The conversation of the scheduled mode, in which the system hands over the activated
// applications.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string_view>

#include "driver/daily_tasks.h"
#include "kv/value.h"
#include "platform/platform.h"

namespace tally {

constexpr std::string_view kServiceName = "vellum.tallyd.tallyrun";
constexpr std::string_view kLoggingNotification = "vellum.tallyd.tallyrun.logging";

// The "operation" of a message: a peer announces that application data will follow, asks for the
// tasks of a day, or delivers the data.
enum Operation : std::int32_t { kLoggingStatus = 0, kRunDay = 1, kAppData = 2 };

// The fields of an application: as messages name them, and as the log does.
enum class ApplicationFieldKind { Text, Number, Uuid };
struct ApplicationField {
  std::string_view sent, logged;
  ApplicationFieldKind kind;
};
inline constexpr ApplicationField kApplicationFields[] = {
    {"bundle_id", "bundle", ApplicationFieldKind::Text},
    {"version", "version", ApplicationFieldKind::Text},
    {"adam_id", "adamID", ApplicationFieldKind::Number},
    {"arch", "arch", ApplicationFieldKind::Number},
    {"uuid", "uuid", ApplicationFieldKind::Uuid},
};
constexpr std::size_t kUuidBytes = 16;

class AppInfoListener {
 public:
  // The platform and the tasks must outlive the listener, which must outlive the last slice of the
  // main event loop.
  AppInfoListener(Platform& platform, DailyTasks& tasks) : platform_(platform), tasks_(tasks) {}

  // Listens for peers; false when the endpoint cannot be created, whose reason is logged.
  bool start();
  // Ends the listening, unless a message had arrived: then it is handled and the result is true.
  bool stop();

  // Does what a message asks for. One whose form does not suit its operation is skipped; one line
  // says so.
  void handleMessage(const KvDictionary& message);

  // True from the announcement of application data until the data was used.
  bool isAppInfoRequested() const { return isAppInfoRequested_; }

 private:
  void receiveAppData(const KvDictionary& message);
  void reportSkipped(std::string_view what);

  Platform& platform_;
  DailyTasks& tasks_;
  bool isAppInfoRequested_ = false;
  // Of all messages that are not application data, only the first is acted upon.
  std::atomic_flag acted_;
};

// The elements of "app_data" in their order, as the log has them. Elements that lack a text or the
// UUID are skipped, and one line says how many and why the first; a number that is missing or of
// another type is 0.
KvRef<KvArray> makeAppInformation(SystemLog& log, const KvArray& appData);

}  // namespace tally
