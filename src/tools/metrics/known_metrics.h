// What is known of the device's metrics: what its tables say, and what the system knows of its own.
#pragma once

#include <string>
#include <string_view>

#include "config/metric_table.h"
#include "tools/frame/output.h"

namespace tally::tools {

class KnownMetrics {
 public:
  // The device's tables, beside what the system knows.
  explicit KnownMetrics(MetricTable ofDevice);

  // Null when nothing is known. A whole key comes before a prefix, and what the device's tables say
  // before what the system knows. Valid as long as this.
  const Metric* find(std::string_view key) const;
  // The longest prefix of which something is known.
  const Metric* prefixOf(std::string_view key) const;
  // How many metrics have keys that begin with the text.
  MetricTable::Below below(std::string_view prefix) const;
  const MetricTable& ofDevice() const { return device_; }

 private:
  MetricTable device_, system_;
};

// Of the context's device; faults are logged.
KnownMetrics knownMetrics(const ToolContext& context);

// "counter, in ms: time for which it was active", as far as it is known.
std::string metricText(const Metric& metric);
// "1,234" becomes "1,234 ms" where there is a unit.
std::string withUnit(std::string number, const Metric* metric);
// {"type", "unit", "description"}, each null where it is not known.
Json jsonOf(const Metric& metric);

}  // namespace tally::tools
