// Daily logs as tools read them: from the spool, from a file, or from a preview.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "base/result.h"
#include "host/spool/log_spool.h"
#include "kv/value.h"
#include "tools/frame/output.h"

namespace tally::tools {

// A document in the form of a daily log. Missing parts of a damaged one are empty.
class DailyLog {
 public:
  // An error if the bytes are not a property list, or not that of a daily log.
  static Result<DailyLog> parse(std::string_view bytes);
  static Result<DailyLog> of(KvRef<KvDictionary> document);

  const KvDictionary& document() const { return *document_; }
  const KvDictionary& scalars() const { return part("TBScalars"); }
  const KvDictionary& distributions() const { return part("TBDistributions"); }
  const KvDictionary& histograms() const { return part("TBDistributionsHistogram"); }
  const KvDictionary& metadata() const { return part("TBMetadata"); }
  // The day that it reports; empty when it does not say.
  std::optional<std::int32_t> day() const;
  std::size_t keyCount() const { return scalars().size() + distributions().size(); }

 private:
  explicit DailyLog(KvRef<KvDictionary> document) : document_(std::move(document)) {}
  const KvDictionary& part(std::string_view name) const;
  KvRef<KvDictionary> document_;
};

// The five numbers of a distribution; empty when the value is anything else.
struct Statistics {
  double minimum, maximum, mean, squaredDeviations;
  std::int64_t count;
  // Of the samples as a whole: the root of the mean squared deviation; 0 without samples.
  double standardDeviation() const;
};
std::optional<Statistics> statisticsOf(const KvObject* value);

bool isDailyLog(const SpooledLog& log);
// What is wrong with a log of the spool: "damaged", or "not a daily log" where a property list of
// another kind is in its place; empty when nothing is.
std::string_view faultOf(const SpooledLog& log, const Result<std::string>& body);

// The spool's logs, and reading one.
class SubmittedLogs {
 public:
  explicit SubmittedLogs(const ToolContext& context);
  // Oldest first.
  Result<std::vector<SpooledLog>> list() const { return reader_.list(); }
  // By number, by file name with or without its ending; an empty name is the newest daily log.
  // Empty when there is none.
  Result<std::optional<SpooledLog>> find(std::string_view name) const;
  Result<std::string> read(const SpooledLog& log) const;
  // The newest daily log that can be read and, when a day is given, reports it.
  struct Found {
    SpooledLog log;
    DailyLog content;
  };
  std::optional<Found> newest(std::optional<std::int32_t> day = std::nullopt) const;

 private:
  SpoolReader reader_;
};

}  // namespace tally::tools
