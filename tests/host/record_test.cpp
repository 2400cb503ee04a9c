// Recordings: what is copied, what is hidden, and how they are written.
#include <gmock/gmock.h>

#include <atomic>
#include <filesystem>
#include <thread>

#include "host/record/pseudonyms.h"
#include "host/record/recording_folder.h"
#include "host/record/tree_recorder.h"
#include "host/temporary_root.h"

namespace tally {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;

class RecordTest : public TemporaryRoot {};

TEST_F(RecordTest, WhatIdentifiesIsANumber) {
  const std::string page(512, '\x01');
  const struct {
    const char *path, *text, *newPath, *newText;
  } cases[] = {
      {"/sys/class/net/wlp3s0", nullptr, "/sys/class/net/if3", nullptr},
      {"/sys/class/net/enx0123456789ab", nullptr, "/sys/class/net/if2", nullptr},
      // Names that are words or numbers of the kernel's are replaced only where names are expected.
      {"/sys/class/net/cpu", nullptr, "/sys/class/net/if1", nullptr},
      {"/sys/devices/virtual/net/cpu/statistics/rx_bytes", "7\n",
       "/sys/devices/virtual/net/if1/statistics/rx_bytes", "7\n"},
      {"/sys/devices/virtual/net/br0/lower_wlp3s0/dev_id", "0x0\n",
       "/sys/devices/virtual/net/br0/lower_if3/dev_id", "0x0\n"},
      {"/sys/devices/system/cpu/cpu0/uevent", "DRIVER=processor\n",
       "/sys/devices/system/cpu/cpu0/uevent", "DRIVER=processor\n"},
      {"/proc/net/dev", "h|\n   cpu: 123456789012 5\nwlp3s0:7 8\n lo: 1 2\n", "/proc/net/dev",
       "h|\n   if1: 123456789012 5\nif3:7 8\n lo: 1 2\n"},
      {"/proc/stat", "cpu 1 2\n", "/proc/stat", "cpu 1 2\n"},
      {"/proc/interrupts", " 25: 10 20 PCI-MSI wlp3s0-TxRx-0\n", "/proc/interrupts",
       " 25: 10 20 PCI-MSI if3-TxRx-0\n"},
      // By the name of the file.
      {"/sys/block/sda/device/serial", "S4EV 1234\n", "/sys/block/sda/device/serial", "serial1\n"},
      {"/sys/block/sdb/device/serial", "9", "/sys/block/sdb/device/serial", "serial2"},
      {"/sys/block/dm-0/dm/name", "alice-home\n", "/sys/block/dm-0/dm/name", "disk1\n"},
      {"/sys/block/md_alice", nullptr, "/sys/block/disk2", nullptr},
      {"/sys/dev/block/8:0", nullptr, "/sys/dev/block/8:0", nullptr},
      {"/sys/devices/a/power_supply/BAT0/uevent",
       "POWER_SUPPLY_SERIAL_NUMBER=123\nPOWER_SUPPLY_ENERGY_NOW=123\nPARTNAME=bob\n",
       "/sys/devices/a/power_supply/BAT0/uevent",
       "POWER_SUPPLY_SERIAL_NUMBER=power_supply_serial_number1\nPOWER_SUPPLY_ENERGY_NOW=123\n"
       "PARTNAME=partname1\n"},
      // By their shape.
      {"/sys/class/hwmon/hid-01:23:45:67:89:AB-battery/name", "01-23-45-67-89-ab and 10.1.2.3\n",
       "/sys/class/hwmon/hid-00:00:00:00:00:01-battery/name", "00-00-00-00-00-01 and 0.0.0.1\n"},
      {"/sys/devices/w1/28-000005e2fdc3/uevent", "X=28-000005E2FDC3\n",
       "/sys/devices/w1/28-000000000001/uevent", "X=28-000000000001\n"},
      {"/proc/sys/kernel/random/boot_id", "0a1b2c3d-1111-2222-3333-444455556666\n",
       "/proc/sys/kernel/random/boot_id", "00000000-0000-0000-0000-000000000001\n"},
      {"/sys/block/sda/stat", "123456789012 1 -123456789012\n", "/sys/block/sda/stat",
       "123456789012 1 -123456789012\n"},
      {"/sys/class/wakeup/wakeup1/name", "fe80::1:2ab3:44 0000:00:1d.0 fe330000.mmc\n",
       "/sys/class/wakeup/wakeup1/name", "::0:2 0000:00:1d.0 fe330000.mmc\n"},
      // Paths, and the table of mounts, of which only what leads to a disk is left.
      {"/sys/block/loop0/loop/backing_file", "/home/alice/my disk.img\n",
       "/sys/block/loop0/loop/backing_file", "/home/dir1/dir2\n"},
      {"/proc/self/mountinfo",
       "24 1 253:0 /@alice / rw,x shared:1 - ext4 /dev/mapper/alice-home rw,y=alice\n"
       "25 24 0:3 / /home/alice/my\\040disk.img rw - nfs bob.example:/x rw,addr=10.0.0.1\n"
       "26 24 0:9 / /rom rw - overlay o rw,lowerdir=/a,upperdir=/overlay/alice\nhostile line\n"
       "27 24 0:8 / /var rw - ubifs ubi0:alice rw\n",
       "/proc/self/mountinfo",
       "24 1 253:0 / / rw - ext4 /dev/mapper/disk1 rw\n"
       "25 24 0:3 / /home/dir1/dir2 rw - nfs none rw\n"
       "26 24 0:9 / /rom rw - overlay none rw,upperdir=/overlay/dir1\n"
       "27 24 0:8 / /var rw - ubifs ubi0:volume1 rw\n"},
      {"/data/alice", nullptr, "/data/dir1", nullptr},
      // What is not a text is left out, except pages of numbers.
      {"/sys/block/sda/device/vpd_pg80", "\x01\x02S4EV", "/sys/block/sda/device/vpd_pg80", ""},
      {"/run/tallyd/nvme-health-nvme0", page.c_str(), "/run/tallyd/nvme-health-nvme0",
       page.c_str()},
      // What a person may have named, unless it is what anyone's machine has.
      {"/proc/sys/kernel/osrelease", "6.1.0-18-cloud-amd64-alice-2\n", "/proc/sys/kernel/osrelease",
       "6.1.0-18-cloud-amd64\n"},
      {"/etc/os-release", "NAME=\"A b\"\nHOME_URL=https://alice.example\nVERSION_ID=12",
       "/etc/os-release", "NAME=\"A b\"\nVERSION_ID=12\n"},
      {"/sys/class/power_supply/hid-S4EVN0X-battery", nullptr, "/sys/class/power_supply/supply1",
       nullptr},
      {"/sys/class/power_supply/axp20x-battery", nullptr, "/sys/class/power_supply/axp20x-battery",
       nullptr},
      {"/sys/class/hwmon/hwmon0/name", "Alice\n", "/sys/class/hwmon/hwmon0/name", "sensor1\n"},
      {"/sys/class/hwmon/hwmon1/name", "ab123456\n", "/sys/class/hwmon/hwmon1/name", "sensor2\n"},
      {"/sys/class/hwmon/hwmon2/name", "k10temp\n", "/sys/class/hwmon/hwmon2/name", "k10temp\n"},
      {"/sys/class/hwmon/hwmon3/name", "BAT0\n", "/sys/class/hwmon/hwmon3/name", "BAT0\n"},
  };
  RecordedTree recorded;
  for (const auto& c : cases) {
    using enum TreeEntry::Type;
    recorded.entries[c.path] = {c.text != nullptr ? File : TreeEntry::Type::Directory,
                                c.text != nullptr ? c.text : ""};
  }
  recorded.entries["/sys/bus/link"] = {TreeEntry::Type::Link, "../../devices/net/wlp3s0"};
  recorded.entries["/var/mobile"] = {TreeEntry::Type::Link, "../data/alice"};
  recorded.samples[1000]["/sys/devices/virtual/net/cpu/statistics/rx_bytes"] = "8\n";
  const RecordedTree hidden = anonymous(recorded);
  for (const auto& c : cases) {
    const auto found = hidden.entries.find(c.newPath);
    ASSERT_NE(found, hidden.entries.end()) << c.path;
    EXPECT_EQ(found->second.text, c.newText != nullptr ? c.newText : "") << c.path;
  }
  EXPECT_THAT(hidden.samples.at(1000),
              ElementsAre(std::pair("/sys/devices/virtual/net/if1/statistics/rx_bytes", "8\n")));
  EXPECT_EQ(hidden.entries.at("/sys/bus/link").text, "../../devices/net/if3");
  EXPECT_EQ(hidden.entries.at("/var/mobile").text, "../data/dir1");
  EXPECT_THAT(hidden.faults, ElementsAre(HasSubstr("vpd_pg80: not a text")));
}

TEST_F(RecordTest, WhatWasAskedForIsThereAgain) {
  namespace fs = std::filesystem;
  put("d/sys/devices/pci0/block/sda/stat", "1 2\n");
  put("d/sys/devices/pci0/block/sda/unasked", "x");
  put("d/sys/devices/pci0/huge", std::string(kLargestRecordedFile + 1, 'x'));
  put("d/proc/uptime", "1.00 2.00\n");
  put("d/run/tallyd/nvme-health-nvme0", std::string(512, '\x01'));
  put("d/run/tallyd/nvme-health-nvme1", "short");
  put("d/run/tallyd/notes", std::string(512, 'x'));
  fs::create_directories(at("d/sys/block"));
  fs::create_symlink("../devices/pci0/block/sda", at("d/sys/block/sda"));
  fs::create_symlink("loop", at("d/sys/block/loop"));
  fs::create_symlink("/../../../../../etc/shadow", at("d/sys/block/out"));
  TreeRecorder recorder{DeviceRoot(at("d"))};
  const auto tree = recorder.observedTree();
  const auto names = tree->list("/sys/block");
  EXPECT_TRUE(tree->text("/sys/block/sda/stat"));
  for (const char* path : {"/sys/block/loop/stat", "/sys/block/out", "/sys/none"}) {
    EXPECT_FALSE(tree->exists(path)) << path;
  }
  EXPECT_FALSE(tree->text("/sys/devices/pci0/huge", 1));
  recorder.take();
  put("d/sys/devices/pci0/block/sda/stat", "3 4\n");
  ASSERT_TRUE(recorder.takeSample(20));
  const RecordedTree recorded = recorder.finish();
  EXPECT_THAT(recorded.faults, ElementsAre("/sys/devices/pci0/huge: too large"));

  put("full/file", "");
  EXPECT_FALSE(checkRecordingFolder(at("full")));
  EXPECT_FALSE(checkRecordingFolder(at("none/r")));
  fs::create_directories(at("r"));
  ASSERT_TRUE(checkRecordingFolder(at("r/")));
  ASSERT_TRUE(writeRecording(recorded, at("r")));
  EXPECT_FALSE(fs::exists(at("r/sys/devices/pci0/block/sda/unasked")));
  EXPECT_THAT(this->names("r/run/tallyd"), ElementsAre("nvme-health-nvme0"));
  const SystemTree replayed{DeviceRoot(at("r"))};
  EXPECT_TRUE(replayed.isRecording());
  EXPECT_EQ(replayed.list("/sys/block"), names);
  EXPECT_EQ(replayed.resolve("/sys/block/sda"), "/sys/devices/pci0/block/sda");
  EXPECT_EQ(replayed.text("/sys/block/sda/stat"), "1 2");
  const SystemTree played(DeviceRoot(at("r")), /*follow=*/true);
  EXPECT_EQ(played.text("/sys/block/sda/stat"), "1 2");
  while (played.generation() == 0) {
  }
  EXPECT_EQ(played.text("/sys/block/sda/stat"), "3 4") << "through the link, below the samples";

  // A recording that cannot be written leaves nothing.
  RecordedTree impossible = recorded;
  impossible.entries["/sys/" + std::string(300, 'x')] = {TreeEntry::Type::File, ""};
  EXPECT_FALSE(writeRecording(impossible, at("s")));
  EXPECT_FALSE(fs::exists(at("s")) || fs::exists(at("s.incomplete")));
}

TEST_F(RecordTest, AFileIsFoundWhileOthersAreRenamed) {
  put("d/sys/devices/a/type", "x\n");
  std::filesystem::create_directories(at("d/sys/class"));
  std::filesystem::create_symlink("../devices/a", at("d/sys/class/a"));
  put("one", "");
  const SystemTree tree{DeviceRoot(at("d"))};
  std::atomic<bool> done = false;
  std::thread renaming([&] {
    while (!done) {
      std::filesystem::rename(at("one"), at("two"));
      std::filesystem::rename(at("two"), at("one"));
    }
  });
  int found = 0;
  constexpr int kTimes = 5000;
  for (int i = 0; i < kTimes; ++i) found += tree.text("/sys/class/a/type") == "x" ? 1 : 0;
  done = true;
  renaming.join();
  EXPECT_EQ(found, kTimes);
}

}  // namespace
}  // namespace tally
