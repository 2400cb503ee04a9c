#include "host/flash/raw_nand.h"

#include "base/number_text.h"
#include "base/text_lines.h"
#include "host/flash/life_time.h"

namespace tally {
namespace {

constexpr std::size_t kLargestEraseTable = 4u << 20;

std::optional<std::uint64_t> count(std::string_view text) {
  const auto number = parseInt64(text);
  if (!number || *number < 0) return std::nullopt;
  return static_cast<std::uint64_t>(*number);
}

// The blocks set aside for bad ones that are still free. Each block that goes bad takes one.
std::optional<PercentRange> spareOf(std::optional<std::uint64_t> free,
                                    std::optional<std::uint64_t> bad) {
  constexpr std::uint64_t kMostBlocks = UINT32_MAX;
  if (!free || !bad || *free > kMostBlocks || *bad > kMostBlocks || *free + *bad == 0) {
    return std::nullopt;
  }
  const auto percent = static_cast<unsigned>(*free * 100 / (*free + *bad));
  return PercentRange{percent, percent};
}

std::string ubiFolder(const std::string& name) { return "/sys/class/ubi/" + name + "/"; }

std::string mtdFolder(const SystemTree& tree, const std::string& name) {
  const auto number = tree.number(ubiFolder(name) + "mtd_num");
  return number && *number >= 0 ? "/sys/class/mtd/mtd" + std::to_string(*number) + "/" : "";
}

}  // namespace

std::optional<EraseCounts> parseEraseCounts(std::string_view table) {
  EraseCounts counts;
  eachLine(table, [&](std::string_view line) {
    const std::size_t blank = line.find_first_of(" \t");
    if (blank == std::string_view::npos || !count(line.substr(0, blank))) return;
    const std::string_view rest = trimmed(line.substr(blank));
    const auto erases = count(rest.substr(0, rest.find_first_of(" \t")));
    if (!erases || *erases > INT64_MAX - counts.total) return;
    ++counts.blocks;
    counts.total += *erases;
  });
  return counts.blocks > 0 ? std::optional(counts) : std::nullopt;
}

std::optional<Wear> parseRawNand(const RawNandAttributes& attributes) {
  Wear wear;
  wear.maximumErases = reported(count(attributes.maximumErases), "`max_ec`");
  wear.badBlocks = reported(count(attributes.badBlocks), "`bad_peb_count`");
  wear.spare = reported(spareOf(count(attributes.reservedForBad), count(attributes.badBlocks)),
                        "`reserved_for_bad` of it and `bad_peb_count`");
  wear.mediaErrorsOfBoot = reported(count(attributes.eccFailures), "`ecc_failures`");
  wear.blocks = reported(count(attributes.blocks), "`total_eraseblocks`");
  const auto blockBytes = count(attributes.blockBytes), pageBytes = count(attributes.pageBytes);
  wear.bytesPerPage = reported(pageBytes, "`writesize`");
  if (blockBytes && pageBytes && *pageBytes > 0) {
    wear.pagesPerBlock = {{*blockBytes / *pageBytes, "`erasesize` over `writesize`"}};
  }
  if (const auto counts = parseEraseCounts(attributes.eraseCounts)) {
    constexpr std::string_view kOrigin = "`detailed_erase_block_info`";
    wear.totalErases = {{counts->total, kOrigin}};
    wear.meanErases = {{counts->total / counts->blocks, kOrigin}};
    // A block is written as a whole between two erasures.
    if (blockBytes && *blockBytes > 0 && counts->total <= UINT64_MAX / *blockBytes) {
      wear.flashBytesWritten = {{counts->total * *blockBytes, kOrigin}};
    }
  }
  return wear.isKnown() ? std::optional(wear) : std::nullopt;
}

std::optional<Wear> readRawNand(const SystemTree& tree, const std::string& name) {
  const std::string mtd = mtdFolder(tree, name);
  const auto ubi = [&](const char* file) { return tree.text(ubiFolder(name) + file).value_or(""); };
  const auto below = [&](const char* file) {
    return mtd.empty() ? std::string() : tree.text(mtd + file).value_or("");
  };
  const std::string maximum = ubi("max_ec"), reserved = ubi("reserved_for_bad"),
                    bad = ubi("bad_peb_count"), blocks = ubi("total_eraseblocks"),
                    blockBytes = below("erasesize"), pageBytes = below("writesize"),
                    failures = below("ecc_failures");
  const std::string counts =
      tree.text("/sys/kernel/debug/ubi/" + name + "/detailed_erase_block_info", kLargestEraseTable)
          .value_or("");
  return parseRawNand({maximum, reserved, bad, blocks, blockBytes, pageBytes, failures, counts});
}

std::string rawNandIdentity(const SystemTree& tree, const std::string& name) {
  const std::string mtd = mtdFolder(tree, name);
  return mtd.empty() ? "" : tree.text(mtd + "name").value_or("");
}

}  // namespace tally
