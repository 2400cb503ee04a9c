#include "tools/metrics/unit_scale.h"

#include <algorithm>
#include <cmath>
#include <iterator>

namespace tally::tools {
namespace {

using enum UnitQuantity;
constexpr std::int64_t kFewestSamples = 10;
constexpr std::string_view kFirstDecimal = "kB";

// The first name of a size is the one that is proposed; decimal sizes of data, at the end, are not:
// they are too near to the binary ones.
constexpr UnitScale kUnitScales[] = {
    {"ns", Time, 1e-9},
    {"nanoseconds", Time, 1e-9},
    {"us", Time, 1e-6},
    {"µs", Time, 1e-6},
    {"microseconds", Time, 1e-6},
    {"ms", Time, 1e-3},
    {"milliseconds", Time, 1e-3},
    {"s", Time, 1},
    {"seconds", Time, 1},
    {"min", Time, 60},
    {"minutes", Time, 60},
    {"h", Time, 3600},
    {"hours", Time, 3600},
    {"d", Time, 86400},
    {"days", Time, 86400},
    {"bytes", Data, 1},
    {"B", Data, 1},
    {"KiB", Data, 1024},
    {"kibibytes", Data, 1024},
    {"MiB", Data, 1048576},
    {"mebibytes", Data, 1048576},
    {"GiB", Data, 1073741824},
    {"gibibytes", Data, 1073741824},
    {kFirstDecimal, Data, 1e3},
    {"KB", Data, 1e3},
    {"kilobytes", Data, 1e3},
    {"MB", Data, 1e6},
    {"megabytes", Data, 1e6},
    {"GB", Data, 1e9},
    {"gigabytes", Data, 1e9},
};

// Whether a good part of the samples lies between the boundaries, or on both sides of the only one.
bool divide(double first, double last, const SampleRange& samples) {
  if (first == last) return samples.minimum <= first && first < samples.maximum;
  return first < samples.mean && samples.mean <= last;
}

}  // namespace

const UnitScale* unitScale(std::string_view unit) {
  const auto* const found = std::ranges::find(kUnitScales, unit, &UnitScale::name);
  return found != std::end(kUnitScales) ? found : nullptr;
}

const UnitScale* likelierUnit(const UnitScale& own, double first, double last,
                              const SampleRange& samples) {
  const bool onOneSide = samples.minimum > last || samples.maximum <= first;
  if (samples.count < kFewestSamples || !onOneSide) return nullptr;
  const UnitScale* best = nullptr;
  const auto distance = [&own](const UnitScale& unit) {
    return std::fabs(std::log(unit.size / own.size));
  };
  for (const UnitScale& unit : kUnitScales) {
    if (unit.name == kFirstDecimal) break;
    const double factor = unit.size / own.size;
    if (unit.quantity != own.quantity || !divide(first * factor, last * factor, samples)) continue;
    if (best == nullptr || distance(unit) < distance(*best)) best = &unit;
  }
  return best;
}

}  // namespace tally::tools
