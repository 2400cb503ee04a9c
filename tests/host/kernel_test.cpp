// The kernel's statistics: what its texts say, what devices are called, and what a sample has when
// files are missing.
#include <gtest/gtest.h>

#include <fmt/format.h>

#include <map>

#include "host/kernel/kernel_region.h"
#include "host/kernel/naming.h"
#include "host/kernel/sources/cpu/interrupts.h"
#include "host/kernel/sources/cpu/processor_time.h"
#include "host/kernel/sources/cpu/processors.h"
#include "host/kernel/sources/network/interfaces.h"
#include "host/kernel/sources/power/supplies.h"
#include "host/kernel/sources/storage/disk.h"
#include "host/kernel/sources/system/pressure.h"
#include "host/kernel/sources/system/time.h"
#include "host/kernel/text_fields.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using Files = std::map<std::string, std::string>;
constexpr std::int64_t kNone = kNoReading;

TEST(KernelTexts, OfEveryKernelAndOfNone) {
  const struct {
    FileParser parse;
    FileLayout layout;
    std::string text;
    std::vector<std::int64_t> fields;
  } cases[] = {
      {parseGauge, {{""}, 1}, " -12500\n", {-12500}},
      {parseGauge, {{""}, 1}, "cus bus\n", {kNone}},
      {parseGauge, {{""}, 1}, "-99999999999999999999999999999999", {kNone}},
      {parseGauge, {{""}, 1}, "12 34", {kNone}},
      {parseCounter, {{""}, 1}, "-1\n", {kNone}},
      {parseDiskStatistics, {{""}, 8}, "   7 0 100 3\n", {7, 0, 50, 3, kNone, kNone, kNone, kNone}},
      {parseDiskStatistics, {{""}, 4}, "7 -1 1x 99999999999999999999 5", {7, kNone, kNone, kNone}},
      {parseInterfaces,
       {{"eth0", "lo", "gone"}, 2},
       "Inter-|   Receive  |\n face |bytes    packets\n    lo: 5 6 7\neth0:1234 8\nnew: 1 1\n",
       {1234, 8, 5, 6, kNone, kNone}},
      {parsePressure,
       {{"some", "full"}, 1},
       "full avg10=0.00 avg60=total=3 total=9\nsome avg10=1.00 total=-4 total=x",
       {kNone, 9}},
      {parseNamedNumbers, {{"A", "B"}, 1}, "B: 7 kB\n\xff\xfe 3\nA\nAA 4\n", {kNone, 7}},
      {parseTimeInFrequency,
       {{"800", "900"}, 1},
       "900 12\n800 9223372036854775807\n",
       {kNone, 120}},
      {parseProcessorTime,
       {{"cpu", "ctxt"}, 2},
       "cpu  3 4 5\ncpu0 1 1\nctxt 77\n",
       {30, 40, 77, kNone}},
      // Processor 1 is offline; a line of one number is for all of them, one of none is nothing.
      {parseInterrupts,
       {{"7", "ERR", "FIQ", "MIS"}, 3},
       "   CPU0 CPU2 CPU99999\n 7: 4294967295 5 6 IR-edge 9\nFIQ:   usb_fiq\nERR: 3\nMIS: 1 x 2\n",
       {4294967295, kNone, 5, 3, kNone, kNone, kNone, kNone, kNone, 1, kNone, kNone}},
      {parseInterrupts, {{"7"}, 1}, "", {kNone}},
      {parseEnergy, {{""}, 1}, "45070000\n", {162252000000}},
      {parseTenths, {{""}, 1}, "-53\n", {-5300}},
      {parseCycles, {{""}, 1}, "0\n", {kNone}},
      {parseUptime, {{""}, 1}, "14100.84 4543.71\n", {14100840}},
      {parseUptime, {{""}, 1}, "9223372036854775.99\n", {kNone}},
  };
  for (const auto& c : cases) {
    std::vector<std::int64_t> fields(c.layout.fields(), kNone);
    c.parse(c.text, c.layout, fields);
    EXPECT_EQ(fields, c.fields) << c.text;
  }
}

// What is counted when a counter falls within one boot.
TEST(KernelTexts, AFallOfAnUnsteadyCounterIsNoRestart) {
  const CounterState kept{"k", "boot", 8000, 100, 5, {}};
  const struct {
    std::uint64_t value;
    bool isUnsteady;
    std::uint64_t sum, last;
  } cases[] = {{8500, true, 600, 8500},
               {7900, true, 100, 8000},  // it wavers: it rises again above 8000 only
               {1000, true, 100, 1000},  // a processor went
               {1000, false, 1100, 1000}};
  for (const auto& c : cases) {
    const CounterState next = nextState(kept, {c.value, "boot", 64, c.isUnsteady}, 5, 0);
    EXPECT_EQ(next.sum, c.sum) << c.value;
    EXPECT_EQ(next.last, c.last) << c.value;
  }
}

class KernelTest : public TemporaryRoot {
 protected:
  void write(const Files& files) const {
    for (const auto& [path, text] : files) put("/" + path, text);
  }
  std::shared_ptr<SystemTree> tree() const { return std::make_shared<SystemTree>(root); }
  Names daily() const {
    Names names;
    const KernelChannels channels(*tree());
    for (const DailyChannel& channel : channels.daily()) names.push_back(channel.name);
    return names;
  }
};

TEST_F(KernelTest, NamesAreUniquePrintableAndOfNoNumberThatChanges) {
  write({{"sys/devices/b/hwmon/hwmon0/name", "chip\n"},
         {"sys/devices/b/hwmon/hwmon0/temp1_input", "1"},
         {"sys/devices/b/hwmon/hwmon0/temp1_crit", "1"},
         {"sys/devices/a/nvme/nvme7/hwmon3/name", "chip\n"},
         {"sys/devices/a/nvme/nvme7/hwmon3/temp10_input", "1"},
         {"sys/devices/a/nvme/nvme7/hwmon3/temp2_input", "1"},
         {"sys/class/thermal/thermal_zone0/type", "so c\n\xff\x1b"},
         {"sys/class/thermal/thermal_zone0/temp", "1"},
         {"sys/class/thermal/thermal_zone1/type", "so c\n\xff\x1b"},
         {"sys/class/thermal/thermal_zone1/temp", "1"},
         {"proc/softirqs", " CPU0\nNET_RX: 5\n"},
         {"proc/interrupts",
          " CPU0\n 9: 1  GPIO  5 Edge      key one\n 10: 1  PCI-MSI 7-edge      nvme0q1\n"
          " 11: 1  GPIO  6 Edge      key one\nNMI: 1   Non-maskable\n"}});
  std::filesystem::create_directories(at("/sys/class/hwmon"));
  std::filesystem::create_directory_symlink("../../devices/b/hwmon/hwmon0",
                                            at("/sys/class/hwmon/hwmon0"));
  std::filesystem::create_directory_symlink("../../devices/a/nvme/nvme7/hwmon3",
                                            at("/sys/class/hwmon/hwmon3"));
  std::filesystem::create_directory_symlink("hwmon9", at("/sys/class/hwmon/hwmon9"));
  EXPECT_THAT(KernelChannels(*tree()).names(),
              ElementsAre("irq.key-one@GPIO--5-Edge", "irq.nvme0q1", "irq.key-one@GPIO--6-Edge",
                          "irq.NMI", "softirq.NET_RX", "thermal.so-c___#1.temperature",
                          "thermal.so-c___#2.temperature", "hwmon.chip@a.temp2",
                          "hwmon.chip@a.temp10", "hwmon.chip@b.temp1"));
  EXPECT_THAT(daily(), ElementsAre("thermal0.temperature", "thermal1.temperature",
                                   "sensor0.temperature", "sensor1.temperature"));
}

TEST(KernelNames, WhatIsPluggedInMovesNeitherOrdinalsNorTheNamesInTheStore) {
  const auto found = named({{"fixed", "disk", "pci/z"},
                            {"stick", "stick", "pci/usb1/1"},
                            {"card", "card", "pci/m", "", true, "", true},
                            {"twin", "disk", "pci/y"}});
  Names names;
  for (const auto& [directory, device] : found) {
    names.push_back(directory + " " + std::to_string(*device.ordinal) + " " + device.lasting);
  }
  EXPECT_THAT(names,
              testing::UnorderedElementsAre("twin 0 disk@pci/y", "fixed 1 disk@pci/z",
                                            "card 2 card@pci/m", "stick 3 stick@pci/usb1/1"));
}

TEST_F(KernelTest, PhysicalDisksAloneAreCounted) {
  for (const char* const name :
       {"sda", "nvme0n1", "nvme0c0n1", "mmcblk0", "mmcblk0boot0", "loop0", "dm-1", "md127", "md_d0",
        "zram0", "sr0", "mtdblock3", "vda", "cciss!c0d0", "mdisk"}) {
    write({{std::string("sys/block/") + name + "/stat", "1 2 3 4 5 6 7 8 9 10 11"}});
  }
  write({{"sys/block/vda/hidden", "1\n"}, {"sys/block/zram0/disksize", "0"}});
  Names names;
  const KernelChannels channels(*tree());
  for (const std::string& name : channels.names()) {
    if (name.ends_with(".reads")) names.push_back(name);
    EXPECT_THAT(name, testing::Not(HasSubstr("discard"))) << "an old kernel counts none";
  }
  EXPECT_THAT(names, ElementsAre("disk.cciss!c0d0.reads", "disk.mdisk.reads", "disk.mmcblk0.reads",
                                 "disk.mtdblock3.reads", "disk.nvme0n1.reads", "disk.sda.reads"));
}

// Of a sample, what each channel's first slot has.
TEST_F(KernelTest, WhatCannotBeReadIsMissingOnceAndTheRestIsThere) {
  const std::string battery = "sys/class/power_supply/B/";
  write({{"proc/uptime", "5.00 1\n"},
         {battery + "type", "Battery\n"},
         {battery + "charge_full", "45\n"},
         {battery + "charge_full_design", "50\n"},
         {battery + "capacity", "80\n"},
         {"sys/class/wakeup/w/name", "rtc0"},
         {"sys/class/wakeup/w/wakeup_count", "3"},
         {"sys/power/suspend_stats/success", "7"}});
  const auto channels = std::make_shared<const KernelChannels>(*tree());
  std::vector<Interest> interests;
  for (const std::string& name : channels->names()) {
    interests.push_back({1, KernelChannels::idOf(name), 0});
  }
  useBoundedLog();
  KernelRegion region(interests, channels, {tree(), log, nullptr});
  std::vector<std::byte> memory(region.size());
  const auto sample = [&] {
    std::string text;
    region.writeFrame(0, memory);
    for (std::size_t i = 0; i < interests.size(); ++i) {
      std::uint64_t id = 0;
      std::int64_t value = 0;
      std::memcpy(&id, memory.data() + i * element::kSize + element::kChannelID, sizeof id);
      std::memcpy(&value, memory.data() + i * element::kSize + element::slot(0), sizeof value);
      if (id == interests[i].channel && channels->names()[i] != "time.span") {
        text += fmt::format("{}={} ", channels->names()[i], value);
      }
    }
    return text;
  };
  EXPECT_EQ(sample(),
            "power.B.health=90 power.B.charge-level=80 power.B.charge-full=45 "
            "power.B.charge-design=50 wakeup.rtc0.wakeups=3 suspend.sleeps=7 "
            "time.uptime=5000 ");
  EXPECT_THAT(daily(), testing::Contains("wakeup.clock.wakeups"));
  std::filesystem::remove_all(at("/sys/class/wakeup"));
  std::filesystem::remove(at("/sys/power/suspend_stats/success"));
  std::filesystem::create_directory(at("/sys/power/suspend_stats/success"));
  write({{battery + "charge_full_design", "0"}, {"proc/uptime", ""}, {battery + "capacity", "x"}});
  const std::string rest = sample();
  EXPECT_THAT(rest, HasSubstr("power.B.charge-full=45"));
  for (const char* const gone : {"health", "level", "uptime"}) {
    EXPECT_THAT(rest, testing::Not(HasSubstr(gone))) << "it is empty or makes no sense";
  }
  EXPECT_THAT(errors(), testing::IsEmpty()) << "that is ordinary";
  write({{"proc/uptime", std::string(5u << 20, '1')}});
  EXPECT_EQ(sample(), sample());
  EXPECT_THAT(errors(), ElementsAre(HasSubstr("/proc/uptime: File too large"))) << "once";
}

}  // namespace
}  // namespace tally
