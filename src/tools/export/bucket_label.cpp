#include "tools/export/bucket_label.h"

#include "base/number_text.h"

namespace tally::tools {

std::optional<BucketBounds> parseBucketLabel(std::string_view label) {
  constexpr std::string_view kBetween = ", ";
  const std::size_t between = label.find(kBetween);
  if (between == std::string_view::npos || !label.starts_with('(') ||
      !(label.ends_with(']') || label.ends_with(')'))) {
    return std::nullopt;
  }
  const auto lower = parseDouble(label.substr(1, between - 1));
  const std::string_view rest = label.substr(between + kBetween.size());
  if (rest.empty()) return std::nullopt;
  const auto upper = parseDouble(rest.substr(0, rest.size() - 1));
  if (!lower || !upper) return std::nullopt;
  return BucketBounds{*lower, *upper};
}

}  // namespace tally::tools
