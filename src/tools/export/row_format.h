// What becomes a row, and the formats that write rows.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "tools/export/bucket_label.h"
#include "tools/report/daily_log.h"

namespace tally::tools {

// Whole numbers beyond it have neighbours that a double cannot tell apart.
constexpr std::uint64_t kLargestExact = (std::uint64_t{1} << 53) - 1;

// What is known of a log beside its body: empty where it is not known.
struct LogOrigin {
  std::string device;                     // the device's pseudonym
  std::optional<std::uint64_t> sequence;  // among the daily logs of that pseudonym
  std::string systemVersion, configuration;
};

// What all rows of a log share. The texts are borrowed.
struct LogHead {
  LogOrigin origin;
  std::optional<std::int32_t> day;  // the day that it reports
  std::optional<std::int64_t> version;
  std::string_view whitelist;  // the digest of the whitelist's file; empty when it is not known
};

struct ExportedBucket {
  BucketBounds bounds;
  std::uint32_t count;
};

struct ExportedDistribution {
  Statistics statistics;
  std::vector<ExportedBucket> histogram;  // in the order of the log; empty without one
};

// Writes the rows of logs one after the other, in memory that does not depend on their number.
class RowFormat {
 public:
  virtual ~RowFormat() = default;
  // The rows that follow are this log's.
  virtual void beginLog(const LogHead& head) = 0;
  virtual void addScalar(std::string_view key, std::int64_t value) = 0;
  virtual void addDistribution(std::string_view key, const ExportedDistribution& values) = 0;
  // After the last log.
  virtual Status finish() { return Done{}; }
};

}  // namespace tally::tools
