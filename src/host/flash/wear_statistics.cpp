#include "host/flash/wear_statistics.h"

#include <cstring>

namespace tally {
namespace {

using Value = std::optional<std::uint64_t>;

template <auto member>
Value plain(const Wear& wear) {
  return wear.*member ? Value((wear.*member)->value) : std::nullopt;
}
// A range is given as its lower end: so much is certain.
template <auto member>
Value least(const Wear& wear) {
  return wear.*member ? Value((wear.*member)->value.least) : std::nullopt;
}
template <auto member>
Value hostUnits(const Wear& wear) {
  return wear.*member ? Value((wear.*member)->value / kHostUnitBytes) : std::nullopt;
}
Value one(const Wear& wear) { return wear.blocks ? Value(1) : std::nullopt; }

constexpr ExportedStatistic kUsed = exportedStatistic("UserPartitionPEPercentUsed"),
                            kFastUsed = exportedStatistic("IntermediatePartitionPEPercentUsed"),
                            kSpareLeft = exportedStatistic("spareAvailablePercent"),
                            kUnclean = exportedStatistic("UncleanBoots"),
                            kReadErrors = exportedStatistic("ueccReads"),
                            kWrites = exportedStatistic("NumLogicalWrites"),
                            kReads = exportedStatistic("NumLogicalReads"),
                            kHottest = exportedStatistic("HighEnduranceBlockEraseCount"),
                            kErases = exportedStatistic("NumPhysicalErases"),
                            kBlocks = exportedStatistic("NumVirtualBlocks"),
                            kPages = exportedStatistic("PagesPerVirtualBlock"),
                            kPageBytes = exportedStatistic("BytesPerPage"),
                            kBlocksPerBlock = exportedStatistic("BlocksPerVirtualBlock");

constexpr std::string_view kStep = "%, lower end of a step of 10";
using enum DiskKind;

constexpr WearStatistic kStatistics[] = {
    {Emmc, kFastUsed, "`life_time`, first byte", kStep, least<&Wear::fastUsed>},
    {Emmc, kUsed, "`life_time`, second byte", kStep, least<&Wear::used>},
    {Ufs, kFastUsed, "`life_time_estimation_a`", kStep, least<&Wear::fastUsed>},
    {Ufs, kUsed, "`life_time_estimation_b`", kStep, least<&Wear::used>},
    {RawNand, kHottest, "`max_ec`", "erasures of the most erased block",
     plain<&Wear::maximumErases>},
    {RawNand, kErases, "`detailed_erase_block_info`, where it may be read",
     "erasures of all blocks", plain<&Wear::totalErases>},
    {RawNand, kSpareLeft, "`reserved_for_bad` of it and `bad_peb_count`", "%", least<&Wear::spare>},
    {RawNand, kReadErrors, "`ecc_failures`", "reads since boot", plain<&Wear::mediaErrorsOfBoot>},
    {RawNand, kBlocks, "`total_eraseblocks`", "blocks", plain<&Wear::blocks>},
    {RawNand, kBlocksPerBlock, "`total_eraseblocks`", "always 1", one},
    {RawNand, kPages, "`erasesize` over `writesize`", "pages", plain<&Wear::pagesPerBlock>},
    {RawNand, kPageBytes, "`writesize`", "bytes", plain<&Wear::bytesPerPage>},
    {Nvme, kUsed, "percentage used", "%", least<&Wear::used>},
    {Nvme, kSpareLeft, "available spare", "%", least<&Wear::spare>},
    {Nvme, kUnclean, "unsafe shutdowns", "shutdowns", plain<&Wear::unsafeShutdowns>},
    {Nvme, kReadErrors, "media errors", "reads", plain<&Wear::mediaErrors>},
    {Nvme, kWrites, "data units written", "4 KiB", hostUnits<&Wear::hostBytesWritten>},
    {Nvme, kReads, "data units read", "4 KiB", hostUnits<&Wear::hostBytesRead>},
};

void appendRecord(std::vector<std::byte>& buffer, std::uint32_t statistic, std::uint64_t value) {
  constexpr std::uint32_t kOneValue = 1;
  const std::size_t at = buffer.size();
  buffer.resize(at + sizeof statistic + sizeof kOneValue + sizeof value);
  std::memcpy(&buffer[at], &statistic, sizeof statistic);
  std::memcpy(&buffer[at + 4], &kOneValue, sizeof kOneValue);
  std::memcpy(&buffer[at + 8], &value, sizeof value);
}

}  // namespace

std::span<const WearStatistic> wearStatistics() { return kStatistics; }

std::vector<std::byte> statisticsBuffer(DiskKind kind, const Wear& wear) {
  std::vector<std::byte> buffer;
  for (const WearStatistic& row : kStatistics) {
    const Value value = row.kind == kind ? row.value(wear) : std::nullopt;
    if (!value) continue;
    if (buffer.empty()) {
      appendRecord(buffer, kExportVersionStatistic, kFullExportVersion);
      appendRecord(buffer, kKnownAloneStatistic, 1);
    }
    // Reports hold signed numbers.
    appendRecord(buffer, row.exported.statistic, std::min<std::uint64_t>(*value, INT64_MAX));
  }
  return buffer;
}

}  // namespace tally
