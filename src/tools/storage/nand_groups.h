// The NAND info dictionary as people read it: in groups, numbered keys on one line.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "kv/value.h"

namespace tally::tools {

constexpr std::string_view kNandPrefix = "vellum.NANDInfo.";

// One figure, or all of a numbered family ("BandsMaxTempHisto" and its 22 values).
struct NandFigure {
  std::string name;  // without the prefix
  std::vector<std::int64_t> values;
  std::optional<std::int64_t> first = {};  // of a family: the number of its first value
};

struct NandGroup {
  std::string_view title;
  std::vector<NandFigure> figures;
};

// Every number of the dictionary whose key contains the text, in groups that are not empty.
std::vector<NandGroup> groupNandInfo(const KvDictionary& info, std::string_view text);

}  // namespace tally::tools
