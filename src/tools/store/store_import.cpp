#include "tools/store/store_import.h"

#include <algorithm>
#include <chrono>

#include <fmt/core.h>

#include "host/store/store_importer.h"
#include "tools/store/record_reader.h"
#include "tools/store/store_csv.h"

namespace tally::tools {
namespace {

constexpr std::size_t kBadLinesKept = 20;

// One line on a terminal that is written over and over; nothing anywhere else.
class ProgressBar {
 public:
  ProgressBar(const ToolContext& context, std::uint64_t totalBytes)
      : context_(context), totalBytes_(totalBytes) {}
  ~ProgressBar() {
    if (shown_) print(context_.err, "\r\x1b[K");
  }
  ProgressBar(const ProgressBar&) = delete;
  ProgressBar& operator=(const ProgressBar&) = delete;

  void update(std::uint64_t bytes, std::uint64_t rows) {
    using std::chrono::steady_clock;
    constexpr std::uint64_t kRowsBetweenLooks = 4096;
    if (!context_.errors.escapes || rows % kRowsBetweenLooks != 0) return;
    const auto now = steady_clock::now();
    if (now < next_) return;
    next_ = now + std::chrono::milliseconds(100);
    shown_ = true;
    std::string line = "\r\x1b[K";
    if (totalBytes_ > 0) {
      const double share =
          std::min(1.0, static_cast<double>(bytes) / static_cast<double>(totalBytes_));
      constexpr double kWidth = 30;
      const auto filled = static_cast<std::size_t>(share * kWidth);
      line += fmt::format("[{:<30}] {:3.0f} %  ", std::string(filled, '#'), share * 100);
    }
    line += fmt::format("{} rows", rows);
    print(context_.err, line);
    std::fflush(context_.err);
  }

 private:
  const ToolContext& context_;
  std::uint64_t totalBytes_;
  bool shown_ = false;
  std::chrono::steady_clock::time_point next_{};
};

Status store(StoreImporter& importer, const StoreRow& row, ImportResult& result) {
  switch (row.kind) {
    case StoreRow::Kind::Scalar:
      ++result.scalars;
      return importer.addScalar(row.day, row.key, row.scalar);
    case StoreRow::Kind::Distribution:
      ++result.samples;
      return importer.addSample(row.day, row.key, row.offset, row.sample, row.weight);
    default:
      return Done{};
  }
}

}  // namespace

ImportResult importStoreCsv(std::FILE* file, std::uint64_t totalBytes, const StoreFile& storeFile,
                            const ToolContext& context) {
  ImportResult result;
  StoreImporter importer(storeFile);
  RecordReader reader(file);
  StoreCsvParser parser;
  ProgressBar progress(context, totalBytes);
  RecordReader::Record record;
  StoreRow row;
  for (std::uint64_t rows = 1; reader.next(record); ++rows) {
    const std::string_view fault =
        record.tooLong ? "longer than any row can be" : parser.parse(record.text, row);
    if (fault.empty()) {
      if (auto stored = store(importer, row, result); !stored) {
        result.failure = stored.error().message;
        return result;
      }
    } else if (++result.rejected <= kBadLinesKept) {
      result.firstRejected.push_back({record.line, fault});
    }
    progress.update(reader.bytesTaken(), rows);
  }
  if (reader.failed()) {
    result.failure = "cannot read the rows";
  } else if (auto finished = importer.finish(); !finished) {
    result.failure = finished.error().message;
  }
  return result;
}

}  // namespace tally::tools
