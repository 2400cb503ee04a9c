// Flash disks: what is read from each kind, which disk is the device's, and what its driver
// exports.
#include <gtest/gtest.h>

#include <fmt/format.h>
#include <sys/stat.h>

#include <map>

#include "base/byte_reader.h"
#include "host/flash/emmc.h"
#include "host/flash/flash_source.h"
#include "host/flash/linux_flash_disks.h"
#include "host/flash/mount_table.h"
#include "host/flash/nvme.h"
#include "host/flash/raw_nand.h"
#include "host/flash/ufs.h"
#include "host/flash/wear_statistics.h"
#include "host/temporary_root.h"
#include "platform/protocol/fetch_request.h"

namespace tally {
namespace {

std::string textOf(const char* name, const Figure<PercentRange>& figure) {
  if (!figure) return "";
  const auto most = figure->value.most ? std::to_string(*figure->value.most) : "";
  return fmt::format("{} {}-{};", name, figure->value.least, most);
}
template <class T>
std::string textOf(const char* name, const Figure<T>& figure) {
  return figure ? fmt::format("{} {};", name, figure->value) : "";
}
std::string textOf(const std::optional<Wear>& wear) {
  if (!wear) return "nothing";
  return textOf("fast", wear->fastUsed) + textOf("used", wear->used) +
         textOf("spare", wear->spare) + textOf("max", wear->maximumErases) +
         textOf("mean", wear->meanErases) + textOf("flash", wear->flashBytesWritten) +
         textOf("written", wear->hostBytesWritten) + textOf("read", wear->hostBytesRead) +
         textOf("unsafe", wear->unsafeShutdowns) + textOf("errors", wear->mediaErrors) +
         textOf("errors of boot", wear->mediaErrorsOfBoot) + textOf("celsius", wear->temperature);
}

TEST(Flash, EmmcAttributes) {
  const struct {
    EmmcAttributes attributes;
    const char* wear;
  } cases[] = {
      {{"MMC", "0x8", "0x01 0x05", "0x01"}, "fast 0-10;used 40-50;spare 20-100;"},
      {{"MMC", "", "0x0B 0x06", "03"}, "fast 100-;used 50-60;spare 0-10;"},
      {{"MMC", "7", "00 0a", "0x00"}, "used 90-100;"},
      {{"MMC", "0x8", "0x03", "0x02"}, "fast 20-30;spare 10-20;"},
      {{"MMC", "0x8", "0x00 0x00", "0x00"}, "nothing"},
      {{"MMC", "0x8", "0x0c 0xff", "4"}, "nothing"},
      {{"MMC", "0x8", "-1 0x100", "0x"}, "nothing"},
      {{"MMC", "0x6", "0x01 0x02", "0x01"}, "nothing"},
      {{"MMC", "x", "0x01 0x02", "0x01"}, "nothing"},
      {{"SD", "0x8", "0x01 0x02", "0x01"}, "nothing"},
      {{"", "", "", ""}, "nothing"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.attributes.lifeTime);
    EXPECT_EQ(textOf(parseEmmc(c.attributes)), c.wear);
  }
}

TEST(Flash, ExtendedRegistersOfAnEmmc) {
  std::string registers(1024, '0');
  registers.replace(2 * 267, 6, "02010b");
  EXPECT_EQ(textOf(parseExtendedRegisters(registers)), "nothing") << "no revision";
  registers.replace(2 * 192, 2, "08");
  EXPECT_EQ(textOf(parseExtendedRegisters(registers)), "fast 0-10;used 100-;spare 10-20;");
  EXPECT_EQ(textOf(parseExtendedRegisters(registers.substr(2))), "nothing");
}

TEST(Flash, UfsHealth) {
  EXPECT_EQ(textOf(parseUfs({"0x01", "0x02", "0x0b"})), "fast 10-20;used 100-;spare 20-100;");
  EXPECT_EQ(textOf(parseUfs({"", "", "0x01"})), "used 0-10;") << "a busy disk answered once";
  EXPECT_EQ(textOf(parseUfs({"0x00", "\xff\xfe", "1 1"})), "nothing");
}

TEST(Flash, RawNandAttributes) {
  const struct {
    const char* name;
    RawNandAttributes attributes;
    const char* wear;
  } cases[] = {
      {"whole",
       {"5", "27", "3", "800", "131072", "2048", "7", ""},
       "spare 90-90;max 5;errors of boot 7;"},
      {"no count of bad blocks", {"5", "27", "", "800", "", "", "", ""}, "max 5;"},
      {"NOR, which has no bad blocks", {"9", "0", "0", "8", "", "0", "", ""}, "max 9;"},
      {"hostile", {"-1", "18446744073709551616", "x", "", "-5", "-7", "1e3", "a b\n"}, "nothing"},
      {"erase counts",
       {"6", "", "", "", "1000", "", "",
        "physical_block_number\terase_count\n0   2 \n1\t6\tused\tclean\n2 -1\n3\n"},
       "max 6;mean 4;flash 8000;"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(textOf(parseRawNand(c.attributes)), c.wear);
  }
}

// A page of 40 °C, 3 % used, 100 % spare, with other bytes at some offsets.
std::string healthPage(const std::map<std::size_t, std::string>& bytes = {}) {
  std::string page(512, '\0');
  page.replace(1, 5, "\x39\x01\x64\x0a\x03");
  for (const auto& [at, text] : bytes) page.replace(at, text.size(), text);
  return page;
}

TEST(Flash, HealthPages) {
  const std::string huge(16, '\xff');
  const struct {
    const char* name;
    std::string page, wear;
  } cases[] = {
      {"as it is", healthPage(), "used 3-3;spare 100-100;unsafe 0;errors 0;celsius 40;"},
      {"beyond the scale", healthPage({{5, "\xff"}, {3, "\x65"}, {1, std::string(2, '\0')}}),
       "used 255-;unsafe 0;errors 0;"},
      {"counts", healthPage({{32, "\x02"}, {48, "\x03"}, {144, "\x05"}, {160, "\x06"}}),
       "used 3-3;spare 100-100;written 1536000;read 1024000;unsafe 5;errors 6;celsius 40;"},
      {"128 bits", healthPage({{48, huge}, {160, std::string(8, '\0') + "\x01"}}),
       "used 3-3;spare 100-100;written 18446744073709551615;unsafe 0;errors "
       "18446744073709551615;celsius 40;"},
      {"no spare, as emulated disks", healthPage({{3, std::string(2, '\0')}}),
       "used 3-3;unsafe 0;errors 0;celsius 40;"},
      {"no spare is left", healthPage({{0, "\x01"}, {3, std::string(2, '\0')}}),
       "used 3-3;spare 0-0;unsafe 0;errors 0;celsius 40;"},
      {"blank", std::string(512, '\0'), "nothing"},
      {"erased", std::string(512, '\xff'), "nothing"},
      {"short", healthPage().substr(1), "nothing"},
      {"empty", "", "nothing"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(textOf(parseHealthPage(std::as_bytes(std::span(c.page)))), c.wear);
  }
}

TEST(Flash, Mounts) {
  constexpr std::string_view kTable =
      "1 0 259:2 / / rw shared:1 - ext4 /dev/root rw\n"
      "2 1 0:40 /a /var/my\\040data rw - btrfs /dev/mapper/x rw,upperdir=/o\\054p\n"
      "3 1 0:41 / /var rw,x - ubifs ubi0:data rw\n"
      "4 1 0:42 / /var rw - overlay overlay rw,lowerdir=/,upperdir=/overlay/up,workdir=/w\n"
      "broken\n5 1 0:43 / /var/mobile\n";
  const struct {
    const char *path, *source, *upper;
  } cases[] = {{"/var/my data/x", "/dev/mapper/x", "/o,p"},
               {"/var/mobile", "overlay", "/overlay/up"},
               {"/variable", "/dev/root", ""}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    const auto mount = mountOf(kTable, c.path);
    ASSERT_TRUE(mount);
    EXPECT_EQ(mount->source, c.source);
    EXPECT_EQ(mountOption(mount->options, "upperdir"), c.upper);
  }
  EXPECT_FALSE(mountOf("", "/var"));
  const std::map<std::string, std::string> sources = {{"ubi12:data", "ubi12"},
                                                      {"/dev/ubi0_1", "ubi0"},
                                                      {"ubi:data", ""},
                                                      {"ubi0x", ""},
                                                      {"/dev/sda1", ""}};
  for (const auto& [source, device] : sources) EXPECT_EQ(ubiDeviceOf(source), device) << source;
}

class FlashTreeTest : public TemporaryRoot {
 protected:
  // "path=content" each; "path>target" is a link, and a content may be empty.
  void putAll(const std::vector<std::string>& files) const {
    for (const std::string& file : files) {
      const std::size_t at = file.find_first_of("=>");
      if (file[at] == '=') {
        put(file.substr(0, at), file.substr(at + 1));
      } else {
        const std::filesystem::path link(this->at(file.substr(0, at)));
        std::filesystem::create_directories(link.parent_path());
        std::filesystem::create_symlink(file.substr(at + 1), link);
      }
    }
  }
  LinuxFlashDisks flashDisks() const {
    return {DiskReader(DeviceRoot(root), clock, std::make_shared<const SystemTree>(root)),
            [] { return false; }};
  }
  // "mmcblk0 eMMC; *nvme0n1 NVMe": the starred one is the device's.
  std::string disks() const {
    std::string text;
    for (const FlashDisk& disk : flashDisks().disks()) {
      text += fmt::format("{}{}{} {}{}", text.empty() ? "" : "; ", disk.isStorage ? "*" : "",
                          disk.name, diskKindName(disk.kind), disk.isRemovable ? " removable" : "");
    }
    return text;
  }
};

const std::vector<std::string> kEmmc = {
    "sys/block/mmcblk0/device/type=MMC", "sys/block/mmcblk0/device/life_time=0x02 0x01",
    "sys/block/mmcblk0/dev=179:0", "sys/block/mmcblk0/mmcblk0p2/dev=179:2",
    "sys/block/mmcblk0/mmcblk0p2/partition=2"};
const std::vector<std::string> kNvme = {
    "sys/block/nvme0n1/device/serial=S1 ", "sys/block/nvme0n1/dev=259:0",
    "sys/block/nvme0n1/nvme0n1p1/dev=259:1", "sys/block/nvme0n1/nvme0n1p1/partition=1"};

std::string mounted(std::string_view device, std::string_view source = "/dev/x",
                    std::string_view point = "/", std::string_view options = "rw") {
  return fmt::format("proc/self/mountinfo=1 0 {} / {} rw - ext4 {} {}\n", device, point, source,
                     options);
}

TEST_F(FlashTreeTest, TheDisksAndTheDevicesOwn) {
  using Files = std::vector<std::string>;
  const struct {
    const char* name;
    std::vector<Files> files;
    const char* disks;
  } cases[] = {
      {"no disk", {{"sys/block/loop0/dev=7:0", "sys/block/sr0/device/x="}}, ""},
      {"a partition", {kEmmc, kNvme, {mounted("179:2")}}, "*mmcblk0 eMMC; nvme0n1 NVMe"},
      {"nothing says it", {kEmmc, kNvme}, "mmcblk0 eMMC; nvme0n1 NVMe"},
      {"the only fixed one; boot areas and paths are not disks",
       {kEmmc,
        {"sys/block/mmcblk0boot0/device/type=MMC", "sys/block/mmcblk1/device/type=SD",
         "sys/block/sda/device/x=", "sys/block/sda/removable=1", "sys/block/nvme0c0n1/device/x="}},
       "*mmcblk0 eMMC; mmcblk1 other removable; sda other removable"},
      {"a volume on an array, and a disk with a loop of layers",
       {kEmmc,
        kNvme,
        {mounted("253:0"), "sys/block/dm-0/dev=253:0",
         "sys/block/dm-0/slaves/dm-1/x=", "sys/block/dm-1/slaves/dm-0/x=",
         "sys/block/dm-0/slaves/md0/x=", "sys/block/md0/slaves/nvme0n1p1/x="}},
       "mmcblk0 eMMC; *nvme0n1 NVMe"},
      {"a loop file that lies on itself",
       {kEmmc,
        kNvme,
        {mounted("7:0"), "sys/block/loop0/dev=7:0", "sys/block/loop0/loop/backing_file=/data.img"}},
       "mmcblk0 eMMC; nvme0n1 NVMe"},
      {"a file system that keeps its own numbers, on a mapped device",
       {kEmmc,
        kNvme,
        {mounted("0:30", "/dev/mapper/data"), "sys/block/dm-3/dm/name=data",
         "sys/block/dm-3/slaves/mmcblk0p2/x="}},
       "*mmcblk0 eMMC; nvme0n1 NVMe"},
      {"an overlay on a UBI volume",
       {{"sys/class/ubi/ubi0/max_ec=1", "sys/class/ubi/ubi1/max_ec=1", "sys/class/ubi/version=1",
         "proc/self/mountinfo=1 0 0:9 / / rw - overlay o rw,upperdir=/over/up\n"
         "2 0 0:8 / /over rw - ubifs ubi1:rootfs_data rw\n"}},
       "ubi0 raw NAND; *ubi1 raw NAND"},
      {"UFS, some way up",
       {{"sys/block/sda>../devices/soc/1000.ufshc/host0/target0/0:0:0:0/block/sda",
         "sys/devices/soc/1000.ufshc/host0/target0/0:0:0:0/block/sda/device>../../../0:0:0:0",
         "sys/devices/soc/1000.ufshc/health_descriptor/eol_info=0x01"}},
       "*sda UFS"},
      {"links that lead nowhere", {{"sys/block/sda>sdb", "sys/block/sdb>sda"}}, ""},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    std::filesystem::remove_all(at("sys"));
    std::filesystem::remove_all(at("proc"));
    for (const auto& files : c.files) putAll(files);
    EXPECT_EQ(disks(), c.disks);
  }
}

TEST_F(FlashTreeTest, WhatADiskIsKnownBy) {
  putAll(kEmmc);
  putAll(kNvme);
  std::string registers(1024, '0');
  registers.replace(2 * 192, 2, "08").replace(2 * 268, 4, "0204");
  putAll({"sys/block/mmcblk1/device>../../devices/mmc1:0001", "sys/devices/mmc1:0001/type=MMC",
          "sys/kernel/debug/mmc1/mmc1:0001/ext_csd=" + registers,
          "sys/block/mmcblk0/device/serial=0x00000000",
          "run/tallyd/nvme-health-nvme0=" + healthPage(), "proc/uptime=90061.25 12.5"});
  const auto found = flashDisks().disks();
  ASSERT_EQ(found.size(), 3u);
  EXPECT_EQ(textOf(found[1].wear), "fast 10-20;used 30-40;") << "of the registers alone";
  EXPECT_EQ(found[0].identity, "") << "a number of zeros tells nothing";
  EXPECT_EQ(found[0].wear->ageSeconds, 90061);
  EXPECT_EQ(found[2].identity, "NVMe S1");
  EXPECT_EQ(textOf(found[2].wear), "used 3-3;spare 100-100;unsafe 0;errors 0;celsius 40;");
}

TEST_F(FlashTreeTest, TheDriverExportsWhatIsKnown) {
  FlashSource source(DiskReader(DeviceRoot(root), clock, std::make_shared<const SystemTree>(root)));
  putAll(kEmmc);
  ASSERT_EQ(source.entries()->size(), 1u);
  EXPECT_EQ(source.entries(), source.entries()) << "nothing has changed";
  const RegistryEntry& entry = *source.entries()->front();
  EXPECT_EQ(entry.className, "SPXStorage");
  RegistryResult result = 0;
  EXPECT_EQ(source.open(entry, 1, &result), nullptr);
  const auto client = source.open(entry, 0, &result);
  ASSERT_TRUE(client);
  std::vector<std::byte> output(256);
  const auto call = [&](std::uint32_t method, std::uint32_t selector, std::uint32_t flags) {
    const auto request = encodeFetchRequest({selector, flags});
    MethodCall made;
    made.structInput = request;
    made.structOutput = output;
    const RegistryResult status = client->call(method, made);
    return std::pair(status, made.structOutputSize);
  };
  using Answer = std::pair<RegistryResult, std::size_t>;
  const std::size_t size = 4 * 16;  // the version, the mark and both figures
  EXPECT_EQ(call(8, 13, 1), Answer(kRegistrySuccess, 4));
  EXPECT_EQ(ByteReader(output).read<std::uint32_t>(0), size);
  EXPECT_EQ(call(8, 13, 0), Answer(kRegistrySuccess, size));
  EXPECT_EQ(ByteReader(output).read<std::uint32_t>(32), 430u);
  EXPECT_EQ(ByteReader(output).read<std::uint64_t>(40), 10u);
  EXPECT_EQ(call(8, 17, 1), Answer(kRegistrySuccess, 4)) << "a list without a byte";
  EXPECT_EQ(call(8, 22, 1).first, kRegistryUnsupported);
  EXPECT_EQ(call(5, 13, 1).first, kRegistryUnsupported);
  put("sys/block/mmcblk0/device/life_time", "0x00 0x00");
  EXPECT_EQ(call(8, 13, 1).first, kRegistryNotFound);
}

TEST(Flash, TheTableOfTheDocument) {
  std::string table = "| disk | key | origin | unit |\n|---|---|---|---|\n";
  for (const WearStatistic& row : wearStatistics()) {
    table += fmt::format("| {} | `{}` | {} | {} |\n", diskKindName(row.kind), row.exported.key,
                         row.origin, row.unit);
  }
  const auto text = readFile(DOCUMENTS "/linux.md", 1 << 20);
  ASSERT_TRUE(text);
  EXPECT_TRUE(text->find("\n\n" + table + "\n") != std::string::npos) << table;
}

}  // namespace
}  // namespace tally
