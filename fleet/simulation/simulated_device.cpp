#include "simulation/simulated_device.h"

#include <array>
#include <vector>

#include <fmt/format.h>

#include "base/files/device_root.h"
#include "base/files/temporary_file.h"
#include "base/time_text.h"
#include "driver/daily_job.h"
#include "host/host_platform.h"
#include "host/spool/log_spool.h"
#include "host/spool/submission_identity.h"
#include "host/store/store_importer.h"
#include "simulation/maker_metrics.h"

namespace tally::simulation {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view kLogSuffix = ".log", kInformationSuffix = ".info.plist";
constexpr int kLateBy = 3, kRepeatedAfter = 1;
// The job runs an hour into the day, and an update is installed after it.
constexpr double kJobAt = 3600, kEvening = 20 * 3600;

class ErrorLog final : public SystemLog {
 public:
  ErrorLog(std::size_t device, bool& failed) : device_(device), failed_(failed) {}
  bool enabled(LogLevel level) const override { return level == LogLevel::Error; }
  void write(LogLevel, std::string_view message) override {
    failed_ = true;
    fmt::print(stderr, "device {}: {}\n", device_, message);
  }

 private:
  std::size_t device_;
  bool& failed_;
};

fs::path rootIn(const fs::path& folder, std::size_t number) {
  const fs::path root = folder / fmt::format("{:06}", number);
  fs::create_directories(root);
  return root;
}

}  // namespace

SimulatedDevice::SimulatedDevice(const Folders& folders, const FleetPlan& plan, std::size_t number,
                                 const std::string& whitelist)
    : arrived_(folders.arrived),
      root_(rootIn(folders.roots, number)),
      plan_(plan),
      device_(plan.device(number)),
      number_(number),
      machine_(root_, plan, number) {
  const DeviceRoot root(root_.string());
  const auto directory = root.make("/Library/Application Support/Tallybook");
  failed_ = !directory || !writeFileAtomically(*directory, "Whitelist_Nimbus.plist", whitelist) ||
            !IdentityFile(root).write({plan.pseudonym(number), {}});
}

SimulatedDevice::~SimulatedDevice() {
  std::error_code ignored;
  fs::remove_all(root_, ignored);
}

bool SimulatedDevice::live() {
  installVersion(root_, false);
  for (int day = 0; day <= plan_.size().days && !failed_; ++day) {
    if (device_.lastDay && day > *device_.lastDay) break;
    machine_.count(day, isNew(day - 1));
    if (plan_.isOff(number_, day)) continue;
    machine_.show(day);
    runDailyJob(day);
    handOver(day);
    if (device_.updateDay == day) installVersion(root_, true);
    record(day);
  }
  return !failed_;
}

bool SimulatedDevice::isNew(int day) const {
  return device_.updateDay && day >= *device_.updateDay;
}

void SimulatedDevice::record(int day) {
  const std::int32_t storeDay = plan_.size().firstDay + day + device_.clockAhead;
  clock_->set(static_cast<double>(storeDay) * kSecondsPerDay + kEvening);
  StoreImporter importer(metricsStoreFile(DeviceRoot(root_.string())));
  Status recorded = addMakerMetrics(importer, plan_, number_, day, storeDay);
  if (recorded) recorded = importer.finish();
  if (recorded) return;
  failed_ = true;
  fmt::print(stderr, "device {}: {}\n", number_, recorded.error().message);
}

void SimulatedDevice::runDailyJob(int day) {
  const std::int32_t today = plan_.size().firstDay + day + device_.clockAhead;
  clock_->set(static_cast<double>(today) * kSecondsPerDay + kJobAt);
  LinuxPlatformOptions options;
  options.log = std::make_shared<ErrorLog>(number_, failed_);
  options.clock = clock_;
  // For each run anew, as a process would.
  const PlatformScope scope(makeHostPlatform(DeviceRoot(root_.string()), options));
  const std::array<const char*, 2> arguments{"tallyrun", "-d"};
  tally::runDailyJob(platform(), arguments);
}

// To the day on which they arrive; a log that is lost is gone.
void SimulatedDevice::handOver(int day) {
  const DeviceDirectory spool = spoolFolder(DeviceRoot(root_.string()));
  const auto names = spool.list();
  if (!names) return;
  const int reported = day - 1;
  std::vector<int> arrivals{device_.lateDay == reported ? day + kLateBy : day};
  if (device_.repeatedDay == reported) arrivals.push_back(day + kRepeatedAfter);
  if (device_.lostDay == reported) arrivals.clear();
  for (const std::string& name : *names) {
    if (!name.ends_with(kLogSuffix) && !name.ends_with(kInformationSuffix)) continue;
    const fs::path sent = fs::path(spool.text()) / name;
    // A spool that was emptied counts from 1 again.
    const std::string number = fmt::format("{:06}{:04}", number_, reported);
    for (const int arrival : arrivals) {
      const fs::path folder = arrived_ / dayText(plan_.size().firstDay + arrival);
      fs::create_directories(folder);
      fs::copy_file(sent, folder / (number + name.substr(name.find('-'))));
    }
    fs::remove(sent);
  }
}

}  // namespace tally::simulation
