// Rows as OpenMetrics, whose samples are grouped by metric instead of by log.
#pragma once

#include <cstdint>
#include <string>

#include "tools/export/row_format.h"
#include "tools/export/sorted_lines.h"
#include "tools/frame/buffered_output.h"
#include "tools/metrics/known_metrics.h"

namespace tally::tools {

// Gauges whose labels name device and key. With times, each log's samples carry the last second of
// its day, and of two logs of one device and day the later one counts. Without, there is nothing to
// tell logs apart: the last log is written alone.
class MetricRows final : public RowFormat {
 public:
  // For a person, texts are made safe to show.
  MetricRows(BufferedOutput& output, KnownMetrics metrics, bool withTimes, bool forPerson)
      : output_(output),
        metrics_(std::move(metrics)),
        withTimes_(withTimes),
        forPerson_(forPerson) {}
  void beginLog(const LogHead& head) override;
  void addScalar(std::string_view key, std::int64_t value) override;
  void addDistribution(std::string_view key, const ExportedDistribution& values) override;
  Status finish() override;

 private:
  enum class Family : std::uint8_t;

  void appendLabel(std::string& labels, const char* name, std::string_view value) const;
  std::string labelsOf(std::string_view key, bool withUnit) const;
  void addSample(Family family, const std::string& labels, std::string_view value);
  void addBuckets(const std::string& labels, const std::vector<ExportedBucket>& histogram);
  void addBucket(const std::string& labels, double limit, std::uint64_t samples);

  BufferedOutput& output_;
  const KnownMetrics metrics_;
  const bool withTimes_, forPerson_;
  std::string device_;  // the label of the log's device; empty when it is not known
  std::optional<std::int64_t> time_;
  bool isLeftOut_ = false;  // the log has no time
  std::size_t logsWithoutDay_ = 0, disorderedHistograms_ = 0;
  std::string sortKey_, line_;  // reused
  SortedLines lines_;
};

}  // namespace tally::tools
