#include "report/read_figures.h"

#include <algorithm>
#include <limits>

namespace tally {
namespace {

void add(LogValues& values, OwnMetric metric, std::int64_t value) {
  const std::string_view key = rowOf(metric).key;
  if (const auto* options = values.scalarOptions(key)) values.addScalar(value, key, *options);
}

}  // namespace

void ReadFigures::addRefusals(std::int64_t count) {
  recorderRan_ = true;
  if (__builtin_add_overflow(refusals_, std::max<std::int64_t>(count, 0), &refusals_)) {
    refusals_ = std::numeric_limits<std::int64_t>::max();
  }
}

void ReadFigures::record(LogValues& values) const {
  if (recorderRan_) add(values, OwnMetric::RefusedInAll, refusals_);
  if (damagedRows && admitted_.has(OwnMetric::DamagedRows)) {
    add(values, OwnMetric::DamagedRows, static_cast<std::int64_t>(*damagedRows));
  }
}

}  // namespace tally
