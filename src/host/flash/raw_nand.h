// Raw NAND: what UBI and MTD know of it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "host/tree/system_tree.h"
#include "platform/flash/wear.h"

namespace tally {

// The attributes of a UBI device and of the MTD device below it, as their files have them; absent
// ones are empty.
struct RawNandAttributes {
  std::string_view maximumErases, reservedForBad, badBlocks, blocks, blockBytes, pageBytes,
      eccFailures;
  std::string_view eraseCounts;  // of each block: a table with a title line
};
std::optional<Wear> parseRawNand(const RawNandAttributes& attributes);

struct EraseCounts {
  std::uint64_t blocks = 0, total = 0;
};
// Of the rows "block erases"; empty if there is none.
std::optional<EraseCounts> parseEraseCounts(std::string_view table);

// Of a UBI device such as "ubi0".
std::optional<Wear> readRawNand(const SystemTree& tree, const std::string& name);
// Raw NAND has no serial number, but it is soldered: its partition tells it.
std::string rawNandIdentity(const SystemTree& tree, const std::string& name);

}  // namespace tally
