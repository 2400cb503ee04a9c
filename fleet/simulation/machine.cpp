#include "simulation/machine.h"

#include <cmath>
#include <cstdlib>
#include <fstream>

#include <fmt/format.h>

#include "base/nvme_health_file.h"
#include "simulation/random.h"

namespace tally::simulation {
namespace {

namespace fs = std::filesystem;

enum class Kind { Counter, Gauge, Percentage };

// What is counted or measured: of a day, and by how much days differ.
struct Amount {
  std::string_view name;
  Kind kind;
  double usual, spread;
};

constexpr auto kCounter = Kind::Counter;
constexpr auto kGauge = Kind::Gauge;
constexpr std::string_view kWakeups = "wakeups";

constexpr Amount kAmounts[] = {
    {kWakeups, kCounter, 1, 0.08},
    {"activations", kCounter, 900, 0.2},
    {"active-ms", kCounter, 60'000, 0.2},
    {"alarms", kCounter, 160, 0.1},
    {"button", kCounter, 22, 0.4},
    {"sleeps", kCounter, 210, 0.2},
    {"sleep-failures", kCounter, 1, 0.5},
    {"sleep-us", kCounter, 4.1e10, 0.1},
    {"uptime", kCounter, 86'400, 0},
    {"user", kCounter, 410'000, 0.3},
    {"nice", kCounter, 9'000, 0.3},
    {"system", kCounter, 150'000, 0.3},
    {"idle", kCounter, 16'000'000, 0.02},
    {"iowait", kCounter, 14'000, 0.4},
    {"softirq", kCounter, 12'000, 0.3},
    {"switches", kCounter, 4.2e7, 0.3},
    {"forks", kCounter, 21'000, 0.2},
    {"interrupts", kCounter, 2.8e7, 0.3},
    {"swap-ins", kCounter, 4'000, 0.7},
    {"swap-outs", kCounter, 9'000, 0.7},
    {"major-faults", kCounter, 2'600, 0.4},
    {"kills", kCounter, 0.1, 1},
    {"pressure-cpu", kCounter, 3.1e8, 0.3},
    {"pressure-memory", kCounter, 2.2e7, 0.5},
    {"pressure-io", kCounter, 9.4e7, 0.4},
    {"reads", kCounter, 64'000, 0.3},
    {"sectors-read", kCounter, 5.1e6, 0.3},
    {"writes", kCounter, 92'000, 0.2},
    {"sectors-written", kCounter, 6.8e6, 0.2},
    {"busy-ms", kCounter, 190'000, 0.3},
    {"discards", kCounter, 800, 0.5},
    {"sectors-discarded", kCounter, 1.1e6, 0.5},
    {"flushes", kCounter, 5'200, 0.2},
    {"received", kCounter, 7.4e8, 0.5},
    {"packets-received", kCounter, 6.1e5, 0.5},
    {"sent", kCounter, 8.8e7, 0.4},
    {"packets-sent", kCounter, 3.9e5, 0.4},
    {"receive-errors", kCounter, 0.5, 1},
    {"receive-drops", kCounter, 6, 0.6},
    {"cooling", kCounter, 40, 0.6},
    {"frequency-changes", kCounter, 88'000, 0.3},
    {"available", kGauge, 1'450'000, 0.1},
    {"anonymous", kGauge, 1'100'000, 0.1},
    {"swap-free", kGauge, 1'700'000, 0.05},
    {"zram-stored", kGauge, 3.1e8, 0.2},
    {"zram-compressed", kGauge, 9.6e7, 0.2},
    {"zram-memory", kGauge, 1.02e8, 0.2},
    {"temperature", kGauge, 41'000, 0.08},
    {"board-temperature", kGauge, 35'000, 0.08},
    {"battery-level", Kind::Percentage, 65, 0.15},
    {"battery-temperature", kGauge, 270, 0.06},
};

struct TreeFile {
  std::string_view path, text;  // {NAME} stands for an amount
};

constexpr TreeFile kFilesOfDay[] = {
    {"proc/uptime", "{uptime}.25 {uptime}.00"},
    {"proc/stat",
     "cpu  {user} {nice} {system} {idle} {iowait} 0 {softirq} 0 0 0\n"
     "intr {interrupts} 0\nctxt {switches}\nbtime 1735689600\nprocesses {forks}\n"
     "procs_running 1\nprocs_blocked 0"},
    {"proc/meminfo",
     "MemTotal:       3900000 kB\nMemFree:         310000 kB\nMemAvailable:   {available} kB\n"
     "Cached:          900000 kB\nAnonPages:      {anonymous} kB\nShmem:            60000 kB\n"
     "Slab:            150000 kB\nSwapTotal:      2000000 kB\nSwapFree:       {swap-free} kB"},
    {"proc/vmstat",
     "pgpgin 1\npgpgout 1\npswpin {swap-ins}\npswpout {swap-outs}\npgfault 1\n"
     "pgmajfault {major-faults}\noom_kill {kills}"},
    {"proc/pressure/cpu", "some avg10=0.00 avg60=0.00 avg300=0.00 total={pressure-cpu}"},
    {"proc/pressure/memory",
     "some avg10=0.00 avg60=0.00 avg300=0.00 total={pressure-memory}\n"
     "full avg10=0.00 avg60=0.00 avg300=0.00 total={pressure-memory}"},
    {"proc/pressure/io",
     "some avg10=0.00 avg60=0.00 avg300=0.00 total={pressure-io}\n"
     "full avg10=0.00 avg60=0.00 avg300=0.00 total={pressure-io}"},
    {"proc/net/dev",
     "Inter-|   Receive                                                |  Transmit\n"
     " face |bytes    packets errs drop fifo frame compressed multicast|bytes    packets errs drop "
     "fifo colls carrier compressed\n"
     "  wlan0: {received} {packets-received} {receive-errors} {receive-drops} 0 0 0 0 "
     "{sent} {packets-sent} 0 0 0 0 0 0"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/stat",
     "{reads} 0 {sectors-read} 1 {writes} 0 {sectors-written} 1 0 {busy-ms} 1 {discards} 0 "
     "{sectors-discarded} 1 {flushes} 1"},
    {"sys/devices/virtual/block/zram0/mm_stat",
     "{zram-stored} {zram-compressed} {zram-memory} 0 120000000 300 0 0 0"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1/active_count",
     "{activations}"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1/event_count",
     "{activations}"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1/total_time_ms",
     "{active-ms}"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1/wakeup_count",
     "{wakeups}"},
    {"sys/devices/platform/soc/rtc/wakeup/wakeup2/wakeup_count", "{alarms}"},
    {"sys/devices/platform/gpio-keys/wakeup/wakeup3/wakeup_count", "{button}"},
    {"sys/power/suspend_stats/success", "{sleeps}"},
    {"sys/power/suspend_stats/fail", "{sleep-failures}"},
    {"sys/power/suspend_stats/total_hw_sleep", "{sleep-us}"},
    {"sys/devices/virtual/thermal/thermal_zone0/temp", "{temperature}"},
    {"sys/devices/virtual/thermal/thermal_zone1/temp", "{board-temperature}"},
    {"sys/devices/virtual/thermal/cooling_device0/stats/total_trans", "{cooling}"},
    {"sys/devices/platform/soc/charger/power_supply/battery/capacity", "{battery-level}"},
    {"sys/devices/platform/soc/charger/power_supply/battery/temp", "{battery-temperature}"},
    {"sys/devices/system/cpu/cpu0/cpufreq/stats/total_trans", "{frequency-changes}"},
};

// Files whose text begins with "->" are links.
constexpr TreeFile kFilesOfDevice[] = {
    {"proc/self/mountinfo",
     "25 1 259:1 / / ro - ext4 /dev/nvme0n1p1 rw\n26 25 259:2 / /var rw - ext4 /dev/nvme0n1p2 rw"},
    {"proc/sys/kernel/ostype", "Linux"},
    {"proc/sys/kernel/osrelease", "6.6.30"},
    {"proc/sys/kernel/hostname", "quillet"},
    {"sys/block/nvme0n1", "->../devices/platform/soc/pcie/nvme/nvme0/nvme0n1"},
    {"sys/block/zram0", "->../devices/virtual/block/zram0"},
    {"sys/devices/virtual/block/zram0/removable", "0"},
    {"sys/devices/virtual/block/zram0/dev", "252:0"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/model", "64 GB"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/device", "->../../nvme0"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/dev", "259:0"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/diskseq", "1"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/removable", "0"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/size", "125000000"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/nvme0n1p1/dev", "259:1"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/nvme0n1p1/partition", "1"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/nvme0n1p2/dev", "259:2"},
    {"sys/devices/platform/soc/pcie/nvme/nvme0/nvme0n1/nvme0n1p2/partition", "2"},
    {"sys/class/net/wlan0", "->../../devices/platform/soc/pcie/pci0000:00/0000:01:00.0/net/wlan0"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/net/wlan0/device",
     "->../../../0000:01:00.0"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/net/wlan0/ifindex", "2"},
    {"sys/class/wakeup/wakeup1",
     "->../../devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1"},
    {"sys/class/wakeup/wakeup2", "->../../devices/platform/soc/rtc/wakeup/wakeup2"},
    {"sys/class/wakeup/wakeup3", "->../../devices/platform/gpio-keys/wakeup/wakeup3"},
    {"sys/devices/platform/soc/pcie/pci0000:00/0000:01:00.0/wakeup/wakeup1/name", "0000:01:00.0"},
    {"sys/devices/platform/soc/rtc/wakeup/wakeup2/name", "alarmtimer.0.auto"},
    {"sys/devices/platform/gpio-keys/wakeup/wakeup3/name", "gpio-keys"},
    {"sys/class/thermal/thermal_zone0", "->../../devices/virtual/thermal/thermal_zone0"},
    {"sys/class/thermal/thermal_zone1", "->../../devices/virtual/thermal/thermal_zone1"},
    {"sys/class/thermal/cooling_device0", "->../../devices/virtual/thermal/cooling_device0"},
    {"sys/devices/virtual/thermal/thermal_zone0/type", "cpu-thermal"},
    {"sys/devices/virtual/thermal/thermal_zone1/type", "board-thermal"},
    {"sys/devices/virtual/thermal/cooling_device0/type", "Processor"},
    {"sys/class/power_supply/battery", "->../../devices/platform/soc/charger/power_supply/battery"},
    {"sys/devices/platform/soc/charger/power_supply/battery/type", "Battery"},
    {"sys/devices/platform/soc/charger/power_supply/battery/charge_full", "3700000"},
    {"sys/devices/platform/soc/charger/power_supply/battery/charge_full_design", "4000000"},
    {"sys/devices/platform/soc/charger/power_supply/battery/cycle_count", "180"},
};

void fail(const std::string& what) {
  fmt::print(stderr, "fleet_simulation: cannot write {}\n", what);
  std::exit(1);
}

// Little endian.
void put(std::string& page, std::size_t at, std::uint64_t value) {
  for (std::size_t i = 0; i < sizeof value; ++i) page[at + i] = static_cast<char>(value >> (8 * i));
}

// The SMART / health page of the disk, as its controller reports it.
std::string healthPage(double percentUsed, int day) {
  constexpr int kPage = 512, kKelvin = 273 + 38;
  constexpr double kUnitsOfDay = 14'000;
  std::string page(kPage, '\0');
  put(page, 1, kKelvin);
  page[3] = static_cast<char>(100 - static_cast<int>(percentUsed / 10));  // spare
  page[4] = 10;                                                           // its threshold
  page[5] = static_cast<char>(static_cast<unsigned>(std::min(percentUsed, 254.0)));
  const double days = day + 150;
  put(page, 32, static_cast<std::uint64_t>(kUnitsOfDay * days * 1.6));
  put(page, 48, static_cast<std::uint64_t>(kUnitsOfDay * days));
  put(page, 128, static_cast<std::uint64_t>(24 * days));
  put(page, 144, static_cast<std::uint64_t>(days / 40));
  return page;
}

}  // namespace

Machine::Machine(fs::path root, const FleetPlan& plan, std::size_t device)
    : root_(std::move(root)), plan_(plan), device_(device) {
  static_assert(std::size(kAmounts) <= kMostAmounts);
  for (const TreeFile& file : kFilesOfDay)
    fs::create_directories((root_ / file.path).parent_path());
  for (const TreeFile& file : kFilesOfDevice) {
    const fs::path path = root_ / file.path;
    fs::create_directories(path.parent_path());
    if (file.text.starts_with("->")) {
      fs::create_symlink(file.text.substr(2), path);
    } else {
      write(std::string(file.path), file.text);
    }
  }
  fs::create_directories(root_ / "proc/sys/kernel/random");
  write("proc/sys/kernel/random/boot_id",
        fmt::format("00000000-0000-4000-8000-{:012x}", device + 1));
  write("sys/devices/platform/soc/pcie/nvme/nvme0/serial", fmt::format("QN{:08}", device + 1));
  fs::create_directories(root_ / kHealthPageFolder);
}

void Machine::count(int day, bool isNewVersion) {
  const DevicePlan& plan = plan_.device(device_);
  const double wakeups = plan.dailyWakeups * (isNewVersion && plan.wakesTwiceAsOften ? 2.0 : 1.0);
  for (std::size_t i = 0; i < std::size(kAmounts); ++i) {
    const Amount& amount = kAmounts[i];
    Random habit({plan_.size().seed, static_cast<std::uint64_t>(Purpose::Habits), device_, i});
    Random random({plan_.size().seed, static_cast<std::uint64_t>(Purpose::Machine), device_,
                   static_cast<std::uint64_t>(day + 1), i});
    constexpr double kDevices = 1.5;  // they differ more than their days
    const double mean = amount.name == kWakeups
                            ? wakeups
                            : amount.usual * std::exp(kDevices * amount.spread * habit.normal());
    // Symmetric, so that the mean of many days is the mean.
    const double value = std::max(0.0, mean * (1 + amount.spread * random.normal()));
    amounts_[i] = amount.kind == Kind::Counter      ? amounts_[i] + value
                  : amount.kind == Kind::Percentage ? std::min(value, 100.0)
                                                    : value;
  }
}

void Machine::show(int day) const {
  for (const TreeFile& file : kFilesOfDay) write(std::string(file.path), filled(file.text));
  const double used = FleetPlan::percentUsed(plan_.device(device_).wearPerDay, day);
  const fs::path page = root_ / kHealthPageFolder / healthPageName("nvme0");
  if (!(std::ofstream(page, std::ios::binary) << healthPage(used, day))) fail(page.string());
}

std::string Machine::filled(std::string_view text) const {
  std::string result;
  while (!text.empty()) {
    const std::size_t open = text.find('{');
    result += text.substr(0, open);
    if (open == text.npos) break;
    const std::size_t close = text.find('}', open);
    const auto row =
        std::ranges::find(kAmounts, text.substr(open + 1, close - open - 1), &Amount::name);
    if (row == std::end(kAmounts)) fail("an unknown amount");
    result += std::to_string(
        static_cast<std::uint64_t>(amounts_[static_cast<std::size_t>(row - kAmounts)]));
    text.remove_prefix(close + 1);
  }
  return result;
}

void Machine::write(const std::string& path, std::string_view text) const {
  std::ofstream file(root_ / path, std::ios::binary);
  file << text << '\n';
  if (!file.flush()) fail(path);
}

void installVersion(const fs::path& root, bool isNew) {
  fs::create_directories(root / "etc");
  std::ofstream file(root / "etc/os-release");
  file << (isNew ? "NAME=Quillet\nVERSION_ID=4.2\nBUILD_ID=R420\n"
                 : "NAME=Quillet\nVERSION_ID=4.1\nBUILD_ID=R410\n");
  if (!file.flush()) fail("os-release");
}

}  // namespace tally::simulation
