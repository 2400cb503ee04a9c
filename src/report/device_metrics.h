// Measures the scalars of kMeasuredMetrics, each only if it is whitelisted.
#pragma once

#include <cstddef>
#include <string_view>
#include <vector>

#include "platform/platform.h"
#include "report/log_values.h"

namespace tally {

// The numbers of installed applications.
void recordApplications(Platform& platform, LogValues& values);
// All others. A value that cannot be measured is recorded as -1 or omitted, depending on its
// source.
void recordDeviceMetrics(Platform& platform, LogValues& values);

// True for the scalars that the report measures itself instead of reading them from the store.
bool isMeasuredByReport(std::string_view key);

// The kernel values from which they are made, and the width of each.
struct KernelValueName {
  std::string_view name;
  std::size_t width;
};
std::vector<KernelValueName> kernelValuesOfReport();

}  // namespace tally
