// The conversation of the scheduled mode, in which the system hands over the activated
// applications.
#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

#include "driver/daily_job.h"
#include "kv/value.h"

namespace tally {

constexpr std::string_view kServiceName = "vellum.tallyd.tallyrun";
constexpr std::string_view kLoggingNotification = "vellum.tallyd.tallyrun.logging";

// What a message asks for, in its "operation": a peer announces that application data will follow,
// asks for the tasks of a day, or delivers the data.
enum Operation : std::int32_t { kLoggingStatus = 0, kRunDay = 1, kAppData = 2 };

// Must outlive the main event loop's last slice.
class AppInfoListener {
 public:
  // Listens for peers on behalf of the job; false when the endpoint cannot be created.
  bool start(DailyJob& job);
  // Ends the listening, unless a message had arrived: then it is handled and the result is true.
  bool stop();

  // Does what a message asks for. One that is not of the form its operation needs is skipped with
  // a line.
  void handleMessage(DailyJob& job, const KvDictionary& message);

 private:
  void receiveAppData(DailyJob& job, const KvDictionary& message);

  // Of all messages that are not application data only the first is acted upon.
  std::atomic_flag acted_;
};

// The elements of "app_data" in their order, each as {"bundle", "version", "adamID", "arch",
// "uuid"}. Elements without "bundle_id", "version" or "uuid" are left out, and one line says how
// many and why the first; a number that is missing or of another type is 0.
KvRef<KvArray> makeAppInformation(const KvArray& appData);

}  // namespace tally
