#include "tools/privacy/exposure.h"

#include <fmt/format.h>
#include <algorithm>
#include <utility>

namespace tally::tools {

std::string distinctText(const DistinctCount& distinct) {
  return fmt::format("{}{}", distinct.more ? "more than " : "", distinct.count);
}

std::string rangeText(const SeenRange& range, KeyKind kind) {
  if (!range.any) return "-";
  const bool scalar = kind == KeyKind::Scalar;
  const std::string low = scalar ? integerText(range.lowest) : realText(range.minimum);
  const std::string high = scalar ? integerText(range.highest) : realText(range.maximum);
  return low == high ? low : low + " to " + high;
}

const KeyExposure* PrivacyReport::find(std::string_view key, KeyKind kind) const {
  const auto found = std::ranges::lower_bound(
      keys, std::pair(key, kind), {},
      [](const KeyExposure& one) { return std::pair(std::string_view(one.key), one.kind); });
  return found != keys.end() && found->key == key && found->kind == kind ? &*found : nullptr;
}

}  // namespace tally::tools
