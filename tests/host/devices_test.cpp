// What the recorded devices of tests/devices say: a few values of each source.
#include <gmock/gmock.h>

#include <cstring>
#include <map>

#include "host/flash/linux_flash_disks.h"
#include "host/kernel/kernel_region.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

class DevicesTest : public TemporaryRoot {
 protected:
  // Of every channel the values that are known, by its name, with the place of all but the first.
  std::map<std::string, std::int64_t> sample(const std::string& device) {
    const DeviceRoot place(std::string(DEVICES) + "/" + device);
    const auto tree = std::make_shared<const SystemTree>(place);
    const auto channels = std::make_shared<const KernelChannels>(*tree);
    std::map<std::uint64_t, std::string> names;
    std::vector<Interest> interests;
    const auto ask = [&](std::uint64_t driver, const std::string& name) {
      names[KernelChannels::idOf(name)] = name;
      interests.push_back({driver, KernelChannels::idOf(name), 0});
    };
    for (const std::string& name : channels->names()) ask(KernelChannels::kFirstDriverID, name);
    for (const DailyChannel& daily : channels->daily()) ask(KernelChannels::kDailyID, daily.name);
    KernelRegion region(interests, channels, {tree, log, nullptr});
    std::vector<std::byte> memory(region.size());
    region.writeFrame(0, memory);
    std::map<std::string, std::int64_t> values;
    std::size_t run = 0;
    for (std::size_t at = 0; at < memory.size(); at += element::kSize) {
      const auto word = [&](std::size_t offset) {
        std::int64_t value = 0;
        std::memcpy(&value, memory.data() + at + offset, sizeof value);
        return value;
      };
      const auto found = names.find(static_cast<std::uint64_t>(word(element::kChannelID)));
      if (found == names.end()) continue;
      run = at > 0 && word(element::kChannelID) == latest_ ? run + 1 : 0;
      latest_ = word(element::kChannelID);
      for (std::size_t slot = 0; slot < element::kSlotCount; ++slot) {
        const std::size_t number = run * element::kSlotCount + slot;
        const std::int64_t value = word(element::slot(slot));
        const std::string place_ = number > 0 ? "[" + std::to_string(number) + "]" : "";
        if (value != kNoReading) values[found->second + place_] = value;
      }
    }
    return values;
  }

 private:
  std::int64_t latest_ = 0;
};

TEST_F(DevicesTest, SayWhatTheirFilesSay) {
  constexpr std::int64_t kAbsent = INT64_MIN;
  const struct {
    const char* device;
    std::map<std::string, std::int64_t> values;
  } cases[] = {
      {"laptop",
       {{"disk.nvme0n1.read", 4000000},
        {"disk.nvme0n1.flushes", 700},
        {"disk.dm-0.reads", kAbsent},
        {"net.if2.received", 7000000000},
        {"pressure.irq.full", 55},
        {"cpu.softirq", 1500},
        {"irq.if2-TxRx-0", 123},
        {"hwmon.thinkpad.fan1", 3120},
        {"hwmon.coretemp.temp2", 49000},
        {"power.BAT0.health", 82},
        {"power.BAT0.energy-full", 147600000000},
        {"battery0.health", 82},
        {"wakeup.PNP0C0D:00.wakeups", 5},
        {"suspend.hardware-sleep", 5000000000},
        {"edac.mc0.corrected", 2},
        {"time.uptime", 86400250}}},
      {"board",
       {{"disk.mmcblk0.written", 200000},
        {"disk.zram0.reads", kAbsent},
        {"zram.zram0.huge-pages", 1},
        {"zram.zram0.huge-pages-ever", kAbsent},
        {"cpu.cpu0.frequency", 408000},
        {"cpu.cpu1.frequency", kAbsent},
        {"cpu.cpu4.frequencies[6]", 2000},
        {"thermal.gpu-thermal.temperature", 41111},
        {"thermal0.temperature", 43333},
        {"thermal1.temperature", 41111},
        {"sensor0.temperature", kAbsent},
        {"net.if1.received", 4294967295}}},
      {"router", {{"net.if3.sent", 60}, {"disk.ubiblock0_0.reads", kAbsent}, {"cpu.irq", 0}}},
      {"phone",
       {{"power.battery.health", 90},
        {"power.battery.cycles", kAbsent},
        {"power.battery.current", -350000},
        {"battery0.temperature", 28700},
        {"disk.sda.busy", 4294967290},
        {"suspend.failures-suspending", 10},
        {"wakeup.alarmtimer.0.auto.wakeups", 90}}},
      {"kernel32",
       {{"disk.sda.queue-time", 1200},
        {"disk.sda.discards", kAbsent},
        {"disk.loop0.reads", kAbsent},
        {"pressure.cpu.some", kAbsent},
        {"paging.out-of-memory-kills", kAbsent},
        {"cpu.interrupts", 4294967290},
        {"cpu.steal", 0},
        {"cpu.guest-nice", kAbsent}}},
      {"machine",
       {{"disk.vda.flushes", 329643},
        {"irq.LOC[1]", 4271797},
        {"cpu.cpu1.idle[6]", 2262826086},
        {"zram.zram0.stored", kAbsent},
        {"net.if1.received", 489052926}}},
  };
  for (const auto& c : cases) {
    const auto values = sample(c.device);
    for (const auto& [name, value] : c.values) {
      const auto found = values.find(name);
      EXPECT_EQ(found != values.end() ? found->second : kAbsent, value) << c.device << " " << name;
    }
  }
  EXPECT_EQ(errors().size(), 0u);
}

TEST_F(DevicesTest, SayWhichDiskIsTheirsAndHowWornItIs) {
  const struct {
    const char *device, *disk;
    std::optional<unsigned> used;  // at least so many percent
  } cases[] = {
      {"laptop", "nvme0n1", 3}, {"board", "mmcblk0", 10}, {"router", "ubi0", std::nullopt},
      {"phone", "sda", 30},     {"kernel32", "sda", {}},  {"machine", "vda", {}},
  };
  for (const auto& c : cases) {
    const DeviceRoot place(std::string(DEVICES) + "/" + c.device);
    const auto tree = std::make_shared<const SystemTree>(place);
    LinuxFlashDisks disks(DiskReader(place, clock, tree), [] { return false; });
    for (const FlashDisk& disk : disks.disks()) {
      EXPECT_EQ(disk.isStorage, disk.name == c.disk) << c.device << " " << disk.name;
      if (!disk.isStorage) continue;
      const auto used = disk.wear ? disk.wear->mostUsed() : std::nullopt;
      EXPECT_EQ(used ? std::optional(used->value.least) : std::nullopt, c.used) << c.device;
    }
  }
}

}  // namespace
}  // namespace tally
