#include "kernel_tree.h"

#include <filesystem>
#include <fstream>

#include <fmt/format.h>

namespace tally::bench {
namespace {

constexpr int kCpus = 64, kDisks = 20, kInterfaces = 30, kInterrupts = 80;

class Tree {
 public:
  explicit Tree(std::string root) : root_(std::move(root)) {}
  void file(const std::string& path, const std::string& text) const {
    const std::filesystem::path whole = root_ + path;
    std::filesystem::create_directories(whole.parent_path());
    std::ofstream(whole) << text;
  }
  void link(const std::string& path, const std::string& target) const {
    const std::filesystem::path whole = root_ + path;
    std::filesystem::create_directories(whole.parent_path());
    std::filesystem::create_symlink(target, whole);
  }

 private:
  std::string root_;
};

std::uint64_t counterOf(int device) { return static_cast<std::uint64_t>(device) + 1; }

// Numbers that look like counters.
std::string columns(int count, std::uint64_t first) {
  std::string text;
  for (int i = 0; i < count; ++i)
    text += fmt::format(" {:10}", first * static_cast<std::uint64_t>(i + 3) * 7919 % 100'000'007);
  return text;
}

std::string perCpu(const std::string& name, std::uint64_t first, const std::string& action = "") {
  return fmt::format("{:>12}:{} {}\n", name, columns(kCpus, first), action);
}

void addTables(const Tree& tree) {
  std::string stat = "cpu " + columns(10, 99) + "\n", header, interrupts, soft;
  for (int i = 0; i < kCpus; ++i) {
    stat += fmt::format("cpu{}{}\n", i, columns(10, counterOf(i)));
    header += fmt::format(" {:>10}", fmt::format("CPU{}", i));
  }
  stat += "intr 123456789" + columns(kInterrupts, 5) + "\nctxt 987654321\nbtime 1700000000\n" +
          "processes 4321\nprocs_running 1\nprocs_blocked 0\nsoftirq 1234" + columns(10, 3) + "\n";
  for (int i = 0; i < kInterrupts; ++i) {
    interrupts +=
        perCpu(std::to_string(i), counterOf(i), fmt::format("PCI-MSI {}-edge nvme0q{}", i, i));
  }
  for (const char* kind : {"HI", "TIMER", "NET_TX", "NET_RX", "BLOCK", "IRQ_POLL", "TASKLET",
                           "SCHED", "HRTIMER", "RCU"}) {
    soft += perCpu(kind, 11);
  }
  tree.file("/proc/stat", stat);
  tree.file("/proc/interrupts", header + "\n" + interrupts);
  tree.file("/proc/softirqs", header + "\n" + soft);
  tree.file("/proc/uptime", "123456.78 7654321.00\n");
  tree.file("/proc/meminfo", "MemTotal: 16000000 kB\nMemAvailable: 8000000 kB\nSwapFree: 0 kB\n");
  tree.file("/proc/vmstat",
            "pgpgin 1\npgpgout 2\npswpin 3\npswpout 4\npgfault 5\npgmajfault 6\noom_kill 0\n");
  tree.file("/proc/sys/kernel/random/boot_id", "9e1c1ad3-8c0a-4b7a-a1f4-29d0a2f1a5f0\n");
  for (const char* kind : {"cpu", "memory", "io", "irq"}) {
    tree.file(std::string("/proc/pressure/") + kind,
              "some avg10=0.00 avg60=0.00 avg300=0.00 total=12345\n"
              "full avg10=0.00 avg60=0.00 avg300=0.00 total=1234\n");
  }
}

void addProcessors(const Tree& tree) {
  for (int i = 0; i < kCpus; ++i) {
    const std::string cpu = fmt::format("/sys/devices/system/cpu/cpu{}", i);
    for (int state = 0; state < 4; ++state) {
      const std::string directory = fmt::format("{}/cpuidle/state{}/", cpu, state);
      tree.file(directory + "name", fmt::format("C{}\n", state));
      tree.file(directory + "time", "123456789\n");
      tree.file(directory + "usage", "98765\n");
    }
    tree.file(cpu + "/cpufreq/stats/time_in_state", "3600000 1234\n2400000 567\n1200000 89\n");
    tree.file(cpu + "/cpufreq/stats/total_trans", "4711\n");
  }
}

void addDevices(const Tree& tree) {
  std::string net = "Inter-|   Receive    |  Transmit\n face |bytes    packets |bytes    packets\n";
  for (int i = 0; i < kDisks; ++i) {
    const std::string disk = fmt::format("sd{}", static_cast<char>('a' + i));
    const std::string device = fmt::format("/sys/devices/pci0000:00/0000:00:{:02x}.0/", i);
    tree.file(device + "block/" + disk + "/stat", columns(17, counterOf(i)) + "\n");
    tree.file(device + "block/" + disk + "/diskseq", std::to_string(i + 1) + "\n");
    tree.link(device + "block/" + disk + "/device", "../..");
    tree.link("/sys/block/" + disk, "../" + (device + "block/" + disk).substr(5));
  }
  for (int i = 0; i < kInterfaces; ++i) {
    const std::string name = fmt::format("eth{}", i);
    const std::string device = fmt::format("/sys/devices/pci0000:00/0000:01:{:02x}.0/", i);
    net += fmt::format("{:>6}:{}\n", name, columns(16, counterOf(i)));
    tree.file(device + "net/" + name + "/ifindex", std::to_string(i + 2) + "\n");
    tree.link(device + "net/" + name + "/device", "../..");
    tree.link("/sys/class/net/" + name, "../../" + (device + "net/" + name).substr(5));
  }
  tree.file("/proc/net/dev", net);
  for (int i = 0; i < 10; ++i) {
    const std::string zone = fmt::format("/sys/devices/virtual/thermal/thermal_zone{}", i);
    tree.file(zone + "/type", fmt::format("zone-{}\n", i));
    tree.file(zone + "/temp", "45000\n");
    tree.link(fmt::format("/sys/class/thermal/thermal_zone{}", i), "../.." + zone.substr(4));
  }
}

}  // namespace

void makeKernelTree(const std::string& root) {
  const Tree tree(root);
  addTables(tree);
  addProcessors(tree);
  addDevices(tree);
}

}  // namespace tally::bench
