#include "config/scalar_options.h"

#include <algorithm>
#include <cmath>
#include <limits>

namespace tally {
namespace {

std::optional<std::uint32_t> unsignedNumber(const KvObject* value) {
  const auto* number = kvCast<KvNumber>(value);
  if (number == nullptr) return std::nullopt;
  const double real = number->asDouble();
  if (!(real >= 0 && real <= std::numeric_limits<std::uint32_t>::max())) return std::nullopt;
  if (std::trunc(real) != real) return std::nullopt;
  return number->asUInt32();
}

bool isArrayOfNumbers(const KvObject& value) {
  const auto* array = kvCast<KvArray>(&value);
  return array != nullptr && std::all_of(array->begin(), array->end(), [](const auto& item) {
           return item->type() == KvType::Number;
         });
}

}  // namespace

std::optional<std::uint32_t> unsignedOption(const ScalarOptions& options, std::string_view key) {
  return unsignedNumber(options.get(key));
}

bool isWellFormedOption(std::string_view key, const KvObject& value) {
  if (key == kOptionSignificantFigures || key == kOptionBucketInterval) {
    return unsignedNumber(&value).has_value();
  }
  return key != kOptionIntervals || isArrayOfNumbers(value);
}

}  // namespace tally
